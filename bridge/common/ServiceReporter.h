#pragma once

#include "bridge/common/Reporter.h"
#include "client/Client.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <memory>
#include <string>
#include <vector>

namespace tamblo::bridge {

/// Reports to the service through the client library, which is driven by this program's own loop: no second
/// thread, and nothing here waits. What the service does not take at once stays in a queue; when that is full
/// the connection is given up, whereupon the service ends all sessions with their summaries, and the
/// listeners begin those that go on anew over the next one.
class ServiceReporter final : public Reporter {
public:
    /// Requests that may wait.
    static constexpr std::size_t kMostWaiting = 8192;

    explicit ServiceReporter(std::string socketPath);
    ~ServiceReporter() override;

    void addListener(ReporterListener& listener) { listeners_.push_back(&listener); }

    /// Tries to reach the service, at once.
    bool connect();
    /// What the loop watches for reading, and for writing while `wantsWriting`; -1 without a connection.
    [[nodiscard]] int descriptor() const noexcept;
    [[nodiscard]] bool wantsWriting() const noexcept { return wantsWriting_; }
    /// Sends and receives what can be without waiting. To be called when the descriptor is ready and before
    /// the loop sleeps. False when it turned out that the service has gone.
    bool pump();
    /// The end: waits until everything has been sent, at most this long.
    void finish(std::chrono::milliseconds patience);

    [[nodiscard]] bool isReachable() const override { return isReached_; }
    [[nodiscard]] SessionID begin(ServiceType serviceType, const std::string& application) override;
    void send(SessionID session, EventCategory category, EventType type, Dictionary payload,
              WallTime at) override;
    void end(SessionID session) override;

    [[nodiscard]] const std::string& socketPath() const noexcept { return socketPath_; }

private:
    struct Request {
        enum class Kind : std::uint8_t { begin, message, end };

        Kind kind;
        SessionID session;
        ServiceType serviceType{};
        EventCategory category{};
        EventType type{};
        Dictionary payload; ///< or the session's configuration
    };

    void queue(Request request);
    void dropFirst();
    /// Whether the library took the request, in full.
    [[nodiscard]] bool hand(const Request& request);
    void lose();

    const std::string socketPath_;
    std::vector<ReporterListener*> listeners_;
    std::unique_ptr<client::Client> client_;
    std::deque<Request> waiting_;
    SessionID last_;
    unsigned stepsHanded_ = 0; ///< of the first of those that wait
    bool isReached_ = false;
    bool wantsWriting_ = false;
    bool hasOverflowed_ = false;
};

} // namespace tamblo::bridge
