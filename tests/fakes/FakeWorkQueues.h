#pragma once

#include "tests/fakes/FakeRepeatingTimer.h"
#include "tests/fakes/FakeSerialQueue.h"

#include <memory>
#include <mutex>
#include <string_view>
#include <vector>

namespace tamblo {

/// Makes queues and timers that a test runs by hand, and finds them again.
class FakeWorkQueues final : public WorkQueues {
public:
    [[nodiscard]] std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view label) override {
        return std::make_unique<FakeSerialQueue>(label);
    }
    [[nodiscard]] std::unique_ptr<RepeatingTimer> makeRepeatingTimer(std::chrono::milliseconds interval,
                                                                     UniqueFunction<void()> tick) override;

    /// Every timer that was made, the latest last; they outlive their timers.
    [[nodiscard]] std::vector<std::shared_ptr<FakeRepeatingTimer::State>> timers() const;
    [[nodiscard]] std::size_t runningTimers() const;
    /// Ticks each running timer once.
    void tick();

private:
    mutable std::mutex mutex_;
    std::vector<std::shared_ptr<FakeRepeatingTimer::State>> timers_;
};

} // namespace tamblo
