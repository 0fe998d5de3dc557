#pragma once

#include "tests/Files.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <atomic>
#include <functional>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace tamblo::test {

/// Answers clients on a socket in a directory of its own, in this process, on a thread of its own, as a test
/// tells it to: in full, not at all, twice. It can go away and come back at the same path.
class FakeService {
public:
    /// Appends the frames that answer a request. Runs on the service's thread.
    using Handler = std::function<void(const wire::Request& request, TextBuffer& replies)>;

    explicit FakeService(Handler handler = answer);
    ~FakeService();

    void start();
    /// Ends every connection and removes the socket.
    void stop();

    [[nodiscard]] const std::string& path() const noexcept { return path_; }
    [[nodiscard]] std::vector<wire::Request> requests();
    /// Waits until this many requests have come, for at most five seconds.
    [[nodiscard]] bool waitForRequests(std::size_t count);
    /// Frames that were no requests.
    [[nodiscard]] int refusals() const noexcept { return refusals_; }
    /// While true nothing is read.
    std::atomic<bool> isDeaf{false};

    /// What the real service answers, but for a start, which it holds.
    static void answer(const wire::Request& request, TextBuffer& replies);

private:
    struct Connection {
        int socket;
        TextBuffer received;
    };
    void run();
    [[nodiscard]] bool serve(Connection& connection);

    Handler handler_;
    TemporaryDirectory directory_;
    const std::string path_ = directory_.path("socket");
    int listener_ = -1;
    std::atomic<bool> isStopping_{false};
    std::atomic<int> refusals_{0};
    std::mutex mutex_;
    std::vector<wire::Request> requests_;
    std::thread thread_;
};

} // namespace tamblo::test
