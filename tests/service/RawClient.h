#pragma once

#include "tests/Sockets.h"
#include "wire/FrameSplitter.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <array>
#include <optional>
#include <vector>

#include <poll.h>
#include <unistd.h>

namespace tamblo::test {

using wire::Method;

[[nodiscard]] inline wire::Request request(Method method, std::int64_t reporterID = 0) {
    return {.method = method, .reporterID = reporterID};
}

/// Of playback's start, for reporter 7, unless others are given.
[[nodiscard]] inline wire::Request message(Dictionary payload, std::vector<std::int64_t> reporterIDs = {7},
                                           std::uint32_t category = 4, std::uint16_t type = 1) {
    return {.method = Method::sendMessage,
            .dictionary = std::move(payload),
            .category = category,
            .type = type,
            .reporterIDs = std::move(reporterIDs)};
}

/// As many frames of the request, with IDs that begin with this one.
[[nodiscard]] inline std::string framesOf(wire::Request request, std::uint64_t firstID = 1,
                                          std::size_t count = 1) {
    TextBuffer frames;
    for (std::size_t i = 0; i < count; ++i) {
        request.id = firstID + i;
        (void)wire::appendRequestFrame(frames, request);
    }
    return std::string(frames.view());
}

/// A client without manners: a blocking socket that sends whatever bytes a test wants and reads replies one
/// by one.
class RawClient {
public:
    /// What fails here fails again with the first bytes that are sent.
    explicit RawClient(const std::string& socketPath)
        : socket_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        const sockaddr_un address = addressOf(socketPath);
        (void)::connect(socket_, reinterpret_cast<const sockaddr*>(&address), sizeof address);
    }
    ~RawClient() { ::close(socket_); }
    RawClient(const RawClient&) = delete;
    RawClient& operator=(const RawClient&) = delete;

    [[nodiscard]] int descriptor() const noexcept { return socket_; }

    /// False when the service has gone.
    bool send(std::string_view bytes) const {
        while (!bytes.empty()) {
            const ssize_t count = ::send(socket_, bytes.data(), bytes.size(), MSG_NOSIGNAL);
            if (count <= 0) {
                return false;
            }
            bytes.remove_prefix(static_cast<std::size_t>(count));
        }
        return true;
    }

    /// The next reply, waiting at most some seconds; nothing at the end of the connection.
    std::optional<wire::Reply> receive() {
        for (;;) {
            wire::FrameSplitter frames(received_);
            if (const auto item = frames.next()) {
                auto reply = wire::decodeReply(*item);
                received_.erase(received_.begin(),
                                received_.end() - static_cast<std::ptrdiff_t>(frames.rest().size()));
                return reply;
            }
            std::array<std::uint8_t, 65536> bytes;
            const ssize_t count = isReadable(20'000) ? ::recv(socket_, bytes.data(), bytes.size(), 0) : 0;
            if (count <= 0) {
                return std::nullopt;
            }
            received_.insert(received_.end(), bytes.begin(), bytes.begin() + count);
        }
    }
    /// The number of replies with IDs of at least this, to the end of the connection.
    std::size_t receiveAll(std::uint64_t leastID = 0) {
        std::size_t count = 0;
        for (auto reply = receive(); reply; reply = receive()) {
            count += reply->id >= leastID ? 1U : 0U;
        }
        return count;
    }

    /// Sends and takes the next reply.
    std::optional<wire::Reply> call(wire::Request request) {
        return send(framesOf(std::move(request), nextID_++)) ? receive() : std::nullopt;
    }
    std::optional<wire::Reply> call(Method method, std::int64_t reporterID = 0) {
        return call(request(method, reporterID));
    }

    /// Whether no reply arrives within a short while.
    [[nodiscard]] bool staysSilent() const { return received_.empty() && !isReadable(50); }
    /// Whether the service has closed the connection; takes what still arrives before that.
    [[nodiscard]] bool isClosedByService() {
        receiveAll();
        return isReadable(0); // the end
    }

private:
    [[nodiscard]] bool isReadable(int milliseconds) const {
        pollfd descriptor{.fd = socket_, .events = POLLIN, .revents = 0};
        return ::poll(&descriptor, 1, milliseconds) == 1;
    }

    int socket_ = -1;
    std::uint64_t nextID_ = 1;
    std::vector<std::uint8_t> received_;
};

/// One that has created and started a session, whose start reply stays held.
class Session : public RawClient {
public:
    explicit Session(const std::string& socketPath, std::int64_t reporterID = 7,
                     std::uint16_t serviceType = 2)
        : RawClient(socketPath) {
        start(reporterID, serviceType);
    }
    /// For another session of the same client.
    void start(std::int64_t reporterID, std::uint16_t serviceType = 2) {
        call(Method::createReportingSession, reporterID);
        call({.method = Method::setServiceType, .reporterID = reporterID, .serviceType = serviceType});
        send(framesOf(request(Method::startReportingSessionForID, reporterID),
                      kStartID + static_cast<std::uint64_t>(reporterID)));
        // The start itself is not answered yet: what comes behind it shows that it has been carried out.
        call(Method::reporterID, reporterID);
    }
    /// True when the stop and the held start have been answered.
    bool stop(std::int64_t reporterID = 7) {
        const auto start = call(Method::stopReportingSessionForID, reporterID);
        return start && start->id >= kStartID && receive();
    }

private:
    /// Above those that `call` gives.
    static constexpr std::uint64_t kStartID = 1'000'000;
};

} // namespace tamblo::test
