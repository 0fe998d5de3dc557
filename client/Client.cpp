#include "client/Client.h"

#include "client/PumpThread.h"
#include "wire/Directories.h"
#include "wire/Request.h"

#include <limits>
#include <type_traits>
#include <utility>

namespace tamblo::client {

using std::chrono::milliseconds;
using wire::Method;
using wire::ResultKind;

namespace {

/// What a callback for a result of each kind takes.
template <ResultKind kKind> struct Taken;
template <> struct Taken<ResultKind::never> : std::type_identity<bool> {};
template <> struct Taken<ResultKind::null> : std::type_identity<Nothing> {};
template <> struct Taken<ResultKind::boolean> : std::type_identity<bool> {};
template <> struct Taken<ResultKind::serviceType> : std::type_identity<ServiceType> {};
template <> struct Taken<ResultKind::dictionary> : std::type_identity<Dictionary> {};
template <> struct Taken<ResultKind::reporterIDs> : std::type_identity<std::vector<std::int64_t>> {};

template <Method kMethod> using ResultOf = Taken<wire::rowOf(kMethod).result>::type;

/// Each answers whether the value, null for null, is of the result's kind.
bool take(const Value* value, Nothing&) {
    return value == nullptr;
}

bool take(const Value* value, bool& result) {
    result = value != nullptr && value->boolValue();
    return value != nullptr && value->kind() == Value::Kind::boolean;
}

bool take(const Value* value, ServiceType& result) {
    if (value == nullptr || value->kind() != Value::Kind::integer ||
        value->unsignedValue() > std::numeric_limits<std::uint16_t>::max()) {
        return false;
    }
    result = static_cast<ServiceType>(value->unsignedValue());
    return true;
}

bool take(const Value* value, Dictionary& result) {
    if (value == nullptr || !value->isDictionary()) {
        return false;
    }
    result = value->dictionaryValue();
    return true;
}

bool take(const Value* value, std::vector<std::int64_t>& result) {
    if (value == nullptr || !value->isArray()) {
        return false;
    }
    for (const Value& element : value->arrayValue()) {
        result.push_back(element.integerValue());
    }
    return true;
}

/// What takes a reply as it comes and hands it to a callback that wants one kind of result.
template <typename T> ReplyFunction expecting(Callback<T> callback) {
    if (!callback) {
        return {};
    }
    return [callback = std::move(callback)](const ReplyView& reply) mutable {
        Result<T> result;
        if (reply.error != nullptr) {
            result.error = *reply.error;
        } else if (!take(reply.value, result.value)) {
            result.error = makeError(ErrorCode::unexpectedReply);
        }
        callback(std::move(result));
    };
}

/// Queues a request of the method with the parameters that it has; false when it is refused.
template <Method kMethod>
bool request(Engine& engine, wire::RequestView request, Callback<ResultOf<kMethod>> callback,
             Replies replies = Replies::first) {
    ClaimedFrame frame(engine);
    request.method = kMethod;
    if (callback) {
        request.id = 0; // another is assigned when it is sent
    }
    if (!frame || !wire::appendRequestFrame(frame->frame, request)) {
        engine.countRefused();
        return false;
    }
    frame->reply = expecting(std::move(callback));
    frame->wantsEveryReply = replies == Replies::every;
    frame.publish();
    return true;
}

/// The same with a future, which is fulfilled even if the request is refused.
template <Method kMethod, typename T = ResultOf<kMethod>>
std::future<Result<T>> requested(Engine& engine, const wire::RequestView& view) {
    const auto promise = std::make_shared<std::promise<Result<T>>>();
    auto future = promise->get_future();
    if (!request<kMethod>(engine, view,
                          [promise](Result<T>&& result) { promise->set_value(std::move(result)); })) {
        promise->set_value({.value = {}, .error = makeError(ErrorCode::refused)});
    }
    return future;
}

wire::RequestView messageView(const Dictionary& payload, EventCategory category, EventType type,
                              std::span<const std::int64_t> reporterIDs) {
    return {.dictionary = payload,
            .category = static_cast<std::uint32_t>(category),
            .type = static_cast<std::uint16_t>(type),
            .reporterIDs = reporterIDs};
}

Engine::Options engineOptions(Client::Options& options) {
    const bool isBackground = options.threading == Client::Threading::background;
    return {.socketPath = options.socketPath.empty() ? wire::Directories::ofThisProcess().socketFile()
                                                     : std::move(options.socketPath),
            .queueCapacity = options.queueCapacity,
            .reconnect = options.reconnect,
            .wakeable = isBackground,
            .onState = std::move(options.onState)};
}

} // namespace

Client::Client(Options options)
    : linger_(options.linger), engine_(std::make_unique<Engine>(engineOptions(options))) {
    if (options.threading == Threading::background) {
        thread_ = std::make_unique<PumpThread>(*engine_, linger_);
    }
}

Client::~Client() {
    if (!thread_ && engine_->isConnected()) {
        flush(linger_);
    }
}

bool Client::createReportingSession(std::int64_t reporterID, Callback<bool> callback) {
    return request<Method::createReportingSession>(*engine_, {.reporterID = reporterID}, std::move(callback));
}

bool Client::setServiceType(ServiceType type, std::int64_t reporterID, Callback<bool> callback) {
    return request<Method::setServiceType>(
        *engine_, {.reporterID = reporterID, .serviceType = static_cast<std::uint16_t>(type)},
        std::move(callback));
}

bool Client::getServiceNameForReporterID(std::int64_t reporterID, Callback<ServiceType> callback,
                                         Replies replies) {
    return request<Method::getServiceNameForReporterID>(*engine_, {.reporterID = reporterID},
                                                        std::move(callback), replies);
}

bool Client::setConfiguration(const Dictionary& configuration, std::int64_t reporterID,
                              Callback<bool> callback) {
    return request<Method::setConfiguration>(
        *engine_, {.reporterID = reporterID, .dictionary = configuration}, std::move(callback));
}

bool Client::startReportingSessionForID(std::int64_t reporterID, Callback<bool> callback, Replies replies) {
    return request<Method::startReportingSessionForID>(*engine_, {.reporterID = reporterID},
                                                       std::move(callback), replies);
}

bool Client::sendMessage(const Dictionary& payload, EventCategory category, EventType type,
                         std::span<const std::int64_t> reporterIDs, Callback<Nothing> callback) {
    return request<Method::sendMessage>(*engine_, messageView(payload, category, type, reporterIDs),
                                        std::move(callback));
}

bool Client::stopReportingSessionForID(std::int64_t reporterID, Callback<bool> callback) {
    return request<Method::stopReportingSessionForID>(*engine_, {.reporterID = reporterID},
                                                      std::move(callback));
}

bool Client::destroyReportingSession(std::int64_t reporterID, Callback<bool> callback) {
    return request<Method::destroyReportingSession>(*engine_, {.reporterID = reporterID},
                                                    std::move(callback));
}

bool Client::reporterID(std::int64_t reporterID, Callback<Dictionary> callback) {
    return request<Method::reporterID>(*engine_, {.reporterID = reporterID}, std::move(callback));
}

bool Client::getAllReporters(Callback<std::vector<std::int64_t>> callback) {
    return request<Method::getAllReporters>(*engine_, {}, std::move(callback));
}

bool Client::killService(Callback<bool> callback) {
    return request<Method::killService>(*engine_, {}, std::move(callback));
}

std::future<Result<bool>> Client::createReportingSession(std::int64_t reporterID) {
    return requested<Method::createReportingSession>(*engine_, {.reporterID = reporterID});
}

std::future<Result<bool>> Client::setServiceType(ServiceType type, std::int64_t reporterID) {
    return requested<Method::setServiceType>(
        *engine_, {.reporterID = reporterID, .serviceType = static_cast<std::uint16_t>(type)});
}

std::future<Result<ServiceType>> Client::getServiceNameForReporterID(std::int64_t reporterID) {
    return requested<Method::getServiceNameForReporterID>(*engine_, {.reporterID = reporterID});
}

std::future<Result<bool>> Client::setConfiguration(const Dictionary& configuration, std::int64_t reporterID) {
    return requested<Method::setConfiguration>(*engine_,
                                               {.reporterID = reporterID, .dictionary = configuration});
}

std::future<Result<bool>> Client::startReportingSessionForID(std::int64_t reporterID) {
    return requested<Method::startReportingSessionForID>(*engine_, {.reporterID = reporterID});
}

std::future<Result<Nothing>> Client::sendMessage(const Dictionary& payload, EventCategory category,
                                                 EventType type, std::span<const std::int64_t> reporterIDs) {
    return requested<Method::sendMessage>(*engine_, messageView(payload, category, type, reporterIDs));
}

std::future<Result<bool>> Client::stopReportingSessionForID(std::int64_t reporterID) {
    return requested<Method::stopReportingSessionForID>(*engine_, {.reporterID = reporterID});
}

std::future<Result<bool>> Client::destroyReportingSession(std::int64_t reporterID) {
    return requested<Method::destroyReportingSession>(*engine_, {.reporterID = reporterID});
}

std::future<Result<Dictionary>> Client::reporterID(std::int64_t reporterID) {
    return requested<Method::reporterID>(*engine_, {.reporterID = reporterID});
}

std::future<Result<std::vector<std::int64_t>>> Client::getAllReporters() {
    return requested<Method::getAllReporters>(*engine_, {});
}

std::future<Result<bool>> Client::killService() {
    return requested<Method::killService>(*engine_, {});
}

bool Client::post(const Dictionary& payload, EventCategory category, EventType type,
                  std::span<const std::int64_t> reporterIDs) {
    return sendMessage(payload, category, type, reporterIDs, nullptr);
}

bool Client::post(const Dictionary& payload, EventCategory category, EventType type,
                  std::initializer_list<std::int64_t> reporterIDs) {
    return sendMessage(payload, category, type, {reporterIDs.begin(), reporterIDs.size()}, nullptr);
}

bool Client::flush(milliseconds timeout) {
    if (thread_) {
        return thread_->flush(timeout);
    }
    const auto deadline = std::chrono::steady_clock::now() + timeout;
    run(milliseconds{0});
    while (!(engine_->isFlushed() && engine_->isConnected()) && std::chrono::steady_clock::now() < deadline) {
        run(milliseconds{1});
    }
    return engine_->isFlushed() && engine_->isConnected();
}

} // namespace tamblo::client
