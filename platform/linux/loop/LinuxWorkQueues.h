#pragma once

#include "platform/WorkQueue.h"
#include "platform/linux/loop/LinuxSerialQueue.h"

#include <memory>

namespace tamblo {

/// Serial queues as strands, and delayed calls on the strands' pool. Works off what was posted before it
/// goes. A queue may be let go after that, but not posted to; a delayed call may not.
class LinuxWorkQueues final : public WorkQueues {
public:
    [[nodiscard]] std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view label) override;
    [[nodiscard]] std::unique_ptr<DelayedCall> callAfter(std::chrono::milliseconds delay,
                                                         UniqueFunction<void()> call) override;
    void workOff() override { threads_.pool().workOff(); }
    /// For the event loop, which lends its thread.
    [[nodiscard]] StrandThreads& threads() noexcept { return threads_; }

private:
    StrandThreads threads_;
};

} // namespace tamblo
