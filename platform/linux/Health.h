#pragma once

#include "base/UniqueFunction.h"
#include "platform/WorkQueue.h"
#include "platform/linux/loop/EventLoop.h"

#include <atomic>
#include <chrono>
#include <optional>
#include <string>

namespace tamblo {

/// Tells the service manager how the service is. A line of what it is doing, when that has changed: a second
/// after it was said that it may have, and with each sign of life. Where the manager runs a watchdog, that
/// sign, twice in each of its periods, for which both the loop and the server queue have to get to a piece of
/// work, so that a stall of either is noticed. Without a manager it does nothing, and no timer runs. Used on
/// the loop's thread, but for `update`.
class Health {
public:
    /// What is to be told now. Called on the loop's thread.
    using Status = UniqueFunction<std::string()>;

    Health(EventLoop& loop, Status status);

    /// Begins to answer the watchdog. Once the service is ready.
    void watch(SerialQueue& serverQueue);
    /// Something may have changed. From any thread.
    void update();

private:
    void giveSign(SerialQueue& serverQueue);
    void tellNews();

    EventLoop& loop_;
    Status status_;
    const bool isManaged_;
    const std::optional<std::chrono::microseconds> period_; ///< of the watchdog
    std::atomic<bool> isTellingDue_{false};
    std::string told_;
};

} // namespace tamblo
