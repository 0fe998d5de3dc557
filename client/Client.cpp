#include "client/Client.h"

#include "client/Directories.h"
#include "client/PumpThread.h"
#include "client/RequestFrame.h"
#include "wire/Protocol.h"

#include <limits>
#include <type_traits>
#include <utility>

namespace tamblo::client {

using std::chrono::milliseconds;
using wire::Method;

namespace {

template <typename T> Result<T> failed(ErrorCode code) {
    return {.value = {}, .error = makeError(code)};
}

std::optional<bool> toResult(const ReplyView& reply, std::type_identity<bool>) {
    if (reply.kind == ReplyView::Kind::boolean) {
        return reply.boolean;
    }
    return reply.kind == ReplyView::Kind::value && reply.value->kind() == Value::Kind::boolean
               ? std::optional(reply.value->boolValue())
               : std::nullopt;
}

std::optional<Nothing> toResult(const ReplyView& reply, std::type_identity<Nothing>) {
    return reply.kind == ReplyView::Kind::null ? std::optional(Nothing{}) : std::nullopt;
}

std::optional<ServiceType> toResult(const ReplyView& reply, std::type_identity<ServiceType>) {
    if (reply.kind != ReplyView::Kind::value || reply.value->kind() != Value::Kind::integer ||
        reply.value->unsignedValue() > std::numeric_limits<std::uint16_t>::max()) {
        return std::nullopt;
    }
    return static_cast<ServiceType>(reply.value->unsignedValue());
}

std::optional<Dictionary> toResult(const ReplyView& reply, std::type_identity<Dictionary>) {
    if (reply.kind != ReplyView::Kind::value || !reply.value->isDictionary()) {
        return std::nullopt;
    }
    return reply.value->dictionaryValue();
}

std::optional<std::vector<std::int64_t>> toResult(const ReplyView& reply,
                                                  std::type_identity<std::vector<std::int64_t>>) {
    if (reply.kind != ReplyView::Kind::value || !reply.value->isArray()) {
        return std::nullopt;
    }
    std::vector<std::int64_t> numbers;
    for (const Value& element : reply.value->arrayValue()) {
        numbers.push_back(element.integerValue());
    }
    return numbers;
}

/// What takes a reply as it comes and hands it to a callback that wants one kind of result.
template <typename T> ReplyFunction expecting(Callback<T> callback) {
    if (!callback) {
        return {};
    }
    return [callback = std::move(callback)](const ReplyView& reply) mutable {
        if (reply.kind == ReplyView::Kind::error) {
            callback({.value = {}, .error = *reply.error});
            return;
        }
        auto value = toResult(reply, std::type_identity<T>());
        if (value) {
            callback({.value = std::move(*value), .error = std::nullopt});
        } else {
            callback(failed<T>(ErrorCode::unexpectedReply));
        }
    };
}

/// Starts a request whose reply fulfils a future, one that was refused included.
template <typename T, typename Start> std::future<Result<T>> asFuture(const Start& start) {
    const auto promise = std::make_shared<std::promise<Result<T>>>();
    auto future = promise->get_future();
    if (!start([promise](Result<T>&& result) { promise->set_value(std::move(result)); })) {
        promise->set_value(failed<T>(ErrorCode::refused));
    }
    return future;
}

Engine::Options engineOptions(Client::Options& options) {
    const bool isBackground = options.threading == Client::Threading::background;
    return {.socketPath = options.socketPath.empty() ? Directories::ofThisProcess().socketFile()
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

template <typename Write> bool Client::enqueue(ReplyFunction reply, Replies replies, const Write& write) {
    ClaimedFrame frame(*engine_);
    if (!frame || !write(frame->frame, static_cast<bool>(reply))) {
        engine_->countRefused();
        return false;
    }
    frame->reply = std::move(reply);
    frame->wantsEveryReply = replies == Replies::every;
    frame.publish();
    return true;
}

bool Client::createReportingSession(std::int64_t reporterID, Callback<bool> callback) {
    return enqueue(expecting(std::move(callback)), Replies::first, [&](TextBuffer& out, bool wantsReply) {
        return request_frame::writeForReporter(out, wantsReply, Method::createReportingSession, reporterID);
    });
}

bool Client::setServiceType(ServiceType type, std::int64_t reporterID, Callback<bool> callback) {
    return enqueue(expecting(std::move(callback)), Replies::first, [&](TextBuffer& out, bool wantsReply) {
        return request_frame::writeSetServiceType(out, wantsReply, type, reporterID);
    });
}

bool Client::getServiceNameForReporterID(std::int64_t reporterID, Callback<ServiceType> callback,
                                         Replies replies) {
    return enqueue(expecting(std::move(callback)), replies, [&](TextBuffer& out, bool wantsReply) {
        return request_frame::writeForReporter(out, wantsReply, Method::getServiceNameForReporterID,
                                               reporterID);
    });
}

bool Client::setConfiguration(const Dictionary& configuration, std::int64_t reporterID,
                              Callback<bool> callback) {
    return enqueue(expecting(std::move(callback)), Replies::first, [&](TextBuffer& out, bool wantsReply) {
        return request_frame::writeSetConfiguration(out, wantsReply, configuration, reporterID);
    });
}

bool Client::startReportingSessionForID(std::int64_t reporterID, Callback<bool> callback, Replies replies) {
    return enqueue(expecting(std::move(callback)), replies, [&](TextBuffer& out, bool wantsReply) {
        return request_frame::writeForReporter(out, wantsReply, Method::startReportingSessionForID,
                                               reporterID);
    });
}

bool Client::sendMessage(const Dictionary& payload, EventCategory category, EventType type,
                         std::span<const std::int64_t> reporterIDs, Callback<Nothing> callback) {
    return enqueue(expecting(std::move(callback)), Replies::first, [&](TextBuffer& out, bool wantsReply) {
        return request_frame::writeMessage(out, wantsReply, payload, category, type, reporterIDs);
    });
}

bool Client::stopReportingSessionForID(std::int64_t reporterID, Callback<bool> callback) {
    return enqueue(expecting(std::move(callback)), Replies::first, [&](TextBuffer& out, bool wantsReply) {
        return request_frame::writeForReporter(out, wantsReply, Method::stopReportingSessionForID,
                                               reporterID);
    });
}

bool Client::destroyReportingSession(std::int64_t reporterID, Callback<bool> callback) {
    return enqueue(expecting(std::move(callback)), Replies::first, [&](TextBuffer& out, bool wantsReply) {
        return request_frame::writeForReporter(out, wantsReply, Method::destroyReportingSession, reporterID);
    });
}

bool Client::reporterID(std::int64_t reporterID, Callback<Dictionary> callback) {
    return enqueue(expecting(std::move(callback)), Replies::first, [&](TextBuffer& out, bool wantsReply) {
        return request_frame::writeForReporter(out, wantsReply, Method::reporterID, reporterID);
    });
}

bool Client::getAllReporters(Callback<std::vector<std::int64_t>> callback) {
    return enqueue(expecting(std::move(callback)), Replies::first, [&](TextBuffer& out, bool wantsReply) {
        return request_frame::writeSimple(out, wantsReply, Method::getAllReporters);
    });
}

bool Client::killService(Callback<bool> callback) {
    return enqueue(expecting(std::move(callback)), Replies::first, [&](TextBuffer& out, bool wantsReply) {
        return request_frame::writeSimple(out, wantsReply, Method::killService);
    });
}

std::future<Result<bool>> Client::createReportingSession(std::int64_t reporterID) {
    return asFuture<bool>(
        [&](Callback<bool> callback) { return createReportingSession(reporterID, std::move(callback)); });
}

std::future<Result<bool>> Client::setServiceType(ServiceType type, std::int64_t reporterID) {
    return asFuture<bool>(
        [&](Callback<bool> callback) { return setServiceType(type, reporterID, std::move(callback)); });
}

std::future<Result<ServiceType>> Client::getServiceNameForReporterID(std::int64_t reporterID) {
    return asFuture<ServiceType>([&](Callback<ServiceType> callback) {
        return getServiceNameForReporterID(reporterID, std::move(callback));
    });
}

std::future<Result<bool>> Client::setConfiguration(const Dictionary& configuration, std::int64_t reporterID) {
    return asFuture<bool>([&](Callback<bool> callback) {
        return setConfiguration(configuration, reporterID, std::move(callback));
    });
}

std::future<Result<bool>> Client::startReportingSessionForID(std::int64_t reporterID) {
    return asFuture<bool>(
        [&](Callback<bool> callback) { return startReportingSessionForID(reporterID, std::move(callback)); });
}

std::future<Result<Nothing>> Client::sendMessage(const Dictionary& payload, EventCategory category,
                                                 EventType type, std::span<const std::int64_t> reporterIDs) {
    return asFuture<Nothing>([&](Callback<Nothing> callback) {
        return sendMessage(payload, category, type, reporterIDs, std::move(callback));
    });
}

std::future<Result<bool>> Client::stopReportingSessionForID(std::int64_t reporterID) {
    return asFuture<bool>(
        [&](Callback<bool> callback) { return stopReportingSessionForID(reporterID, std::move(callback)); });
}

std::future<Result<bool>> Client::destroyReportingSession(std::int64_t reporterID) {
    return asFuture<bool>(
        [&](Callback<bool> callback) { return destroyReportingSession(reporterID, std::move(callback)); });
}

std::future<Result<Dictionary>> Client::reporterID(std::int64_t reporterID) {
    return asFuture<Dictionary>(
        [&](Callback<Dictionary> callback) { return this->reporterID(reporterID, std::move(callback)); });
}

std::future<Result<std::vector<std::int64_t>>> Client::getAllReporters() {
    return asFuture<std::vector<std::int64_t>>(
        [&](Callback<std::vector<std::int64_t>> callback) { return getAllReporters(std::move(callback)); });
}

std::future<Result<bool>> Client::killService() {
    return asFuture<bool>([&](Callback<bool> callback) { return killService(std::move(callback)); });
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
