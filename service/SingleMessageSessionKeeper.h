#pragma once

#include "platform/Clock.h"
#include "platform/WorkQueue.h"
#include "service/ZRReportingServiceDelegateProtocol.h"
#include "util/Context.h"

#include <chrono>
#include <condition_variable>
#include <memory>
#include <mutex>
#include <optional>

namespace tamblo {

/// Owns the process-wide single-message session, which takes messages that are for no session in particular.
///
/// The session is made when it is first asked for, and stopped and dropped by the reaper once nobody has
/// asked for it for longer than the timeout. The reaper is a repeating timer that runs only while there is a
/// session; the stop happens on its thread, outside the lock, so that the reporting server queue need not
/// wait for it.
class SingleMessageSessionKeeper {
public:
    explicit SingleMessageSessionKeeper(Context& context) noexcept : context_(context) {}
    /// Drops the session unstopped; returns when the reaper is at rest.
    ~SingleMessageSessionKeeper();
    SingleMessageSessionKeeper(const SingleMessageSessionKeeper&) = delete;
    SingleMessageSessionKeeper& operator=(const SingleMessageSessionKeeper&) = delete;

    /// The session, made and started when there is none. On the reporting server queue.
    [[nodiscard]] SessionRef retrieve();
    /// Stops the session on the calling thread and waits for one that the reaper is stopping. Not from the
    /// reaper.
    void stop();

    /// Null when there is none now. Any thread.
    [[nodiscard]] SessionRef singleMessageSession() const;

private:
    static constexpr std::chrono::milliseconds kReaperInterval{500};
    static constexpr std::chrono::duration<double> kTimeout{5.0};

    [[nodiscard]] SessionRef create();
    /// One tick of the reaper.
    void reapSingleMessageSession();
    /// The session, if it has been idle for too long; it and the reaper are gone from here then.
    [[nodiscard]] SessionRef takeIdleSession(std::unique_ptr<RepeatingTimer>& reaper);

    Context& context_;
    mutable std::mutex mutex_;
    SessionRef singleMessageSession_;
    std::optional<WallTime> singleMessageSessionLastRetrieved_;
    std::unique_ptr<RepeatingTimer> singleMessageSessionReaper_;
    int runningReaps_ = 0;
    std::condition_variable reapEnded_;
};

} // namespace tamblo
