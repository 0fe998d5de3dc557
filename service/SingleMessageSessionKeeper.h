#pragma once

#include "platform/WorkQueue.h"
#include "service/ZRReportingServiceDelegateProtocol.h"
#include "util/Context.h"

#include <chrono>
#include <memory>

namespace tamblo {

/// Owns the process-wide single-message session, which takes messages that are for no session in particular.
///
/// The session is made when it is first asked for, and stopped and dropped once nobody has asked for it for
/// longer than the timeout. Every half second, while there is a session, a delayed call looks whether that is
/// so; without one there are no wake-ups. On the reporting server queue, where the stop happens, too.
class SingleMessageSessionKeeper : public std::enable_shared_from_this<SingleMessageSessionKeeper> {
public:
    explicit SingleMessageSessionKeeper(Context& context) noexcept : context_(context) {}
    SingleMessageSessionKeeper(const SingleMessageSessionKeeper&) = delete;
    SingleMessageSessionKeeper& operator=(const SingleMessageSessionKeeper&) = delete;

    /// The session, made and started when there is none.
    [[nodiscard]] const SessionRef& retrieve();
    /// Stops and drops the session.
    void stop();

    /// Null when there is none now.
    [[nodiscard]] const SessionRef& singleMessageSession() const noexcept { return singleMessageSession_; }

private:
    [[nodiscard]] SessionRef create();
    void tickLater();
    void reapSingleMessageSession();
    /// Stops a session that is nobody's any more, in parts.
    void stopSome(SessionRef session);

    Context& context_;
    SessionRef singleMessageSession_;
    std::chrono::steady_clock::time_point singleMessageSessionLastRetrieved_;
    std::unique_ptr<DelayedCall> singleMessageSessionReaper_;
};

} // namespace tamblo
