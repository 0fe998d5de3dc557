#pragma once

#include "tests/Files.h"
#include "tests/Sockets.h"
#include "wire/FrameSplitter.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <atomic>
#include <chrono>
#include <functional>
#include <mutex>
#include <thread>

#include <poll.h>
#include <unistd.h>

namespace tamblo::test {

/// Answers one client at a time, on a thread of its own. It can go away and come back at the same path.
class FakeService {
public:
    /// Appends the frames that answer a request. Runs on the service's thread.
    using Handler = std::function<void(const wire::Request& request, TextBuffer& replies)>;

    explicit FakeService(Handler handler = answer) : handler_(std::move(handler)) { start(); }
    ~FakeService() { stop(); }

    void start() {
        listener_ = boundSocket(SOCK_STREAM, path_);
        thread_ = std::jthread([this](const std::stop_token& end) { run(end); });
    }
    /// Ends the connection and removes the socket.
    void stop() {
        if (thread_.joinable()) {
            thread_ = {};
            ::close(listener_);
            ::unlink(path_.c_str());
        }
    }

    [[nodiscard]] const std::string& path() const noexcept { return path_; }
    [[nodiscard]] std::vector<wire::Request> requests() {
        const std::lock_guard lock(mutex_);
        return requests_;
    }
    /// Waits until this many requests have come, for at most five seconds.
    [[nodiscard]] bool waitForRequests(std::size_t count) {
        for (int i = 0; i < 5000 && requests().size() < count; ++i) {
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        }
        return requests().size() >= count;
    }
    /// While true nothing is read.
    std::atomic<bool> isDeaf{false};

    /// What the real service answers, but for a start, which it holds.
    static void answer(const wire::Request& request, TextBuffer& replies) {
        const std::uint64_t id = request.id.value_or(0);
        const auto result = wire::rowOf(request.method).result;
        if (!request.id || request.method == wire::Method::startReportingSessionForID) {
            return;
        }
        if (result == wire::ResultKind::null) {
            wire::appendNullReply(replies, id);
        } else if (result == wire::ResultKind::boolean) {
            wire::appendBooleanReply(replies, id, true);
        } else if (result == wire::ResultKind::serviceType) {
            wire::appendUnsignedReply(replies, id, 7);
        } else if (result == wire::ResultKind::dictionary) {
            wire::appendDictionaryReply(replies, id, {{"reporterID", request.reporterID}});
        } else if (result == wire::ResultKind::reporterIDs) {
            wire::appendIntegersReply(replies, id, std::vector<std::int64_t>{7, -8});
        }
    }

private:
    void run(const std::stop_token& end) {
        int connection = -1;
        TextBuffer received;
        while (!end.stop_requested()) {
            pollfd watched[2] = {{.fd = listener_, .events = POLLIN, .revents = 0},
                                 {.fd = isDeaf ? -1 : connection, .events = POLLIN, .revents = 0}};
            ::poll(watched, 2, 2);
            if (watched[1].revents != 0 && !serve(connection, received)) {
                ::close(connection);
                connection = -1;
            }
            if (connection < 0 && watched[0].revents != 0) {
                connection = ::accept4(listener_, nullptr, nullptr, SOCK_CLOEXEC);
                received.clear();
            }
        }
        ::close(connection);
    }
    /// False at the end of the connection.
    bool serve(int connection, TextBuffer& received) {
        constexpr std::size_t readBytes = 256 * 1024;
        const ssize_t count = ::recv(connection, received.room(readBytes), readBytes, 0);
        if (count <= 0) {
            return false;
        }
        received.commit(static_cast<std::size_t>(count));
        wire::FrameSplitter frames(received.bytes());
        TextBuffer replies;
        KeySetCache keySets;
        while (const auto item = frames.next()) {
            wire::Request request;
            if (wire::decodeRequest(*item, keySets, request)) {
                return false;
            }
            handler_(request, replies);
            const std::lock_guard lock(mutex_);
            requests_.push_back(std::move(request));
        }
        received.dropFront(received.size() - frames.rest().size());
        return ::send(connection, replies.data(), replies.size(), MSG_NOSIGNAL) >= 0;
    }

    const Handler handler_;
    const TemporaryDirectory directory_;
    const std::string path_ = directory_.path("socket");
    int listener_ = -1;
    std::mutex mutex_;
    std::vector<wire::Request> requests_;
    std::jthread thread_;
};

} // namespace tamblo::test
