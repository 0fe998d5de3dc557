#pragma once

#include "platform/WorkQueue.h"

#include <atomic>
#include <chrono>
#include <memory>
#include <utility>

namespace tamblo {

/// Ticks when a test says so. The tick survives the timer while it runs, so that it may destroy the timer.
class FakeRepeatingTimer final : public RepeatingTimer {
public:
    struct State {
        std::chrono::milliseconds interval;
        UniqueFunction<void()> tick;
        std::atomic<bool> isRunning = false;
    };

    explicit FakeRepeatingTimer(std::shared_ptr<State> state) : state_(std::move(state)) {}
    ~FakeRepeatingTimer() override { state_->isRunning = false; }

    void start() override { state_->isRunning = true; }
    void invalidate() override { state_->isRunning = false; }

private:
    const std::shared_ptr<State> state_;
};

} // namespace tamblo
