#pragma once

#include "platform/WorkQueue.h"
#include "platform/linux/loop/LinuxRepeatingTimer.h"
#include "platform/linux/loop/LinuxSerialQueue.h"

#include <memory>

namespace tamblo {

/// Serial queues as strands, delayed calls on the strands' pool, and timers. Works off what was posted before
/// it goes. A queue may be let go after that, but not posted to; a delayed call may not.
class LinuxWorkQueues final : public WorkQueues {
public:
    LinuxWorkQueues();
    ~LinuxWorkQueues() override;

    [[nodiscard]] std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view label) override;
    [[nodiscard]] std::unique_ptr<RepeatingTimer> makeRepeatingTimer(std::chrono::milliseconds interval,
                                                                     UniqueFunction<void()> tick) override;
    [[nodiscard]] std::unique_ptr<DelayedCall> callAfter(std::chrono::milliseconds delay,
                                                         UniqueFunction<void()> call) override;
    void workOff() override { threads_.pool().workOff(); }
    /// Called after each tick of any timer, on its thread: what a tick recorded is written out.
    void setTickEnd(UniqueFunction<void()> tickEnd);
    /// For the event loop, which lends its thread.
    [[nodiscard]] StrandThreads& threads() noexcept { return threads_; }

private:
    struct TickEnd;

    std::shared_ptr<TickEnd> tickEnd_;
    std::shared_ptr<LinuxRepeatingTimer::Retired> retired_;
    StrandThreads threads_;
};

} // namespace tamblo
