#include "bridge/common/ServiceReporter.h"

#include "os/RandomNumber.h"

#include <array>
#include <utility>

namespace tamblo::bridge {

using std::chrono::milliseconds;

namespace {

/// Requests that the library holds; each slot takes some 1,200 bytes from the start.
constexpr std::size_t kLibraryQueue = 128;

/// Reporters of different clients should have different identifiers, so these begin anywhere.
SessionID firstIdentifier() noexcept {
    return static_cast<SessionID>((randomNumber() & 0x7FFFFFFFU) << 24U);
}

} // namespace

ServiceReporter::ServiceReporter(std::string socketPath)
    : socketPath_(std::move(socketPath)), last_(firstIdentifier()) {}

ServiceReporter::~ServiceReporter() = default;

bool ServiceReporter::connect() {
    if (isReached_) {
        return true;
    }
    if (!client_) {
        client_ = std::make_unique<client::Client>(
            client::Client::Options{.socketPath = socketPath_,
                                    .threading = client::Client::Threading::caller,
                                    .queueCapacity = kLibraryQueue,
                                    .reconnect = false,
                                    .linger = milliseconds{0}});
    }
    if (!client_->connect()) {
        return false;
    }
    isReached_ = true;
    for (ReporterListener* const listener : listeners_) {
        listener->reporterCame();
    }
    return true;
}

int ServiceReporter::descriptor() const noexcept {
    return client_ ? client_->descriptor() : -1;
}

void ServiceReporter::lose() {
    client_.reset();
    waiting_.clear();
    stepsHanded_ = 0;
    wantsWriting_ = false;
    hasOverflowed_ = false;
    if (std::exchange(isReached_, false)) {
        for (ReporterListener* const listener : listeners_) {
            listener->reporterWent();
        }
    }
}

bool ServiceReporter::pump() {
    if (!isReached_) {
        return true;
    }
    bool isFlushed = false;
    do {
        const std::size_t before = waiting_.size();
        while (!waiting_.empty() && hand(waiting_.front())) {
            dropFirst();
        }
        // What the library refuses though its queue was empty, it will never take.
        if (isFlushed && waiting_.size() == before) {
            dropFirst();
        }
        isFlushed = client_->flush(milliseconds{0});
    } while (isFlushed && !waiting_.empty());
    if (!client_->isConnected() || hasOverflowed_) {
        lose();
        return false;
    }
    wantsWriting_ = !isFlushed;
    return true;
}

void ServiceReporter::dropFirst() {
    waiting_.pop_front();
    stepsHanded_ = 0;
}

void ServiceReporter::finish(milliseconds patience) {
    const auto deadline = std::chrono::steady_clock::now() + patience;
    while (isReached_ && pump() && wantsWriting_ && std::chrono::steady_clock::now() < deadline) {
        client_->flush(milliseconds{5});
    }
}

bool ServiceReporter::hand(const Request& request) {
    client::Client& client = *client_;
    const SessionID session = request.session;
    switch (request.kind) {
    case Request::Kind::message:
        return client.sendMessage(request.payload, request.category, request.type, std::array{session},
                                  nullptr);
    case Request::Kind::begin:
        // A step that was refused is taken up where it was.
        switch (stepsHanded_) {
        case 0:
            if (!client.createReportingSession(session, nullptr)) {
                return false;
            }
            ++stepsHanded_;
            [[fallthrough]];
        case 1:
            if (!client.setServiceType(request.serviceType, session, nullptr)) {
                return false;
            }
            ++stepsHanded_;
            [[fallthrough]];
        case 2:
            if (!client.setConfiguration(request.payload, session, nullptr)) {
                return false;
            }
            ++stepsHanded_;
            [[fallthrough]];
        default:
            return client.startReportingSessionForID(session, nullptr);
        }
    case Request::Kind::end:
        if (stepsHanded_ == 0 && !client.stopReportingSessionForID(session, nullptr)) {
            return false;
        }
        stepsHanded_ = 1;
        return client.destroyReportingSession(session, nullptr);
    }
    return true;
}

void ServiceReporter::queue(Request request) {
    if (!isReached_ || hasOverflowed_) {
        return;
    }
    if (waiting_.size() >= kMostWaiting) {
        hasOverflowed_ = true;
        return;
    }
    waiting_.push_back(std::move(request));
}

SessionID ServiceReporter::begin(ServiceType serviceType, const std::string& application) {
    if (!isReached_) {
        return kNoSession;
    }
    const SessionID session = ++last_;
    queue({.kind = Request::Kind::begin,
           .session = session,
           .serviceType = serviceType,
           .payload = {{"HostApplicationDisplayID", application}}});
    return session;
}

void ServiceReporter::send(SessionID session, EventCategory category, EventType type, Dictionary payload,
                           WallTime at) {
    if (session == kNoSession) {
        return;
    }
    payload.set("zrreporting_timestamp", secondsSince1970(at));
    queue({.kind = Request::Kind::message,
           .session = session,
           .category = category,
           .type = type,
           .payload = std::move(payload)});
}

void ServiceReporter::end(SessionID session) {
    if (session != kNoSession) {
        queue({.kind = Request::Kind::end, .session = session, .payload = {}});
    }
}

} // namespace tamblo::bridge
