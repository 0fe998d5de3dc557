#pragma once

#include "platform/Clock.h"

#include <atomic>
#include <chrono>

namespace tamblo {

/// Time that stands still until a test turns it; the time of day begins in March 2026, and may be set alone.
class FakeClock final : public Clock {
public:
    [[nodiscard]] WallTime now() const noexcept override {
        return WallTime(std::chrono::nanoseconds(nanoseconds_.load(std::memory_order_relaxed)));
    }
    [[nodiscard]] std::chrono::steady_clock::time_point steadyNow() const noexcept override {
        return std::chrono::steady_clock::time_point(std::chrono::nanoseconds(steady_.load()));
    }
    [[nodiscard]] double seconds() const noexcept { return secondsSince1970(now()); }
    [[nodiscard]] std::chrono::seconds utcOffset(WallTime) const override { return offset; }
    void sleepFor(std::chrono::microseconds time) override { advance(time); }
    void advance(std::chrono::nanoseconds step) noexcept {
        nanoseconds_ += step.count();
        steady_ += step.count();
    }
    void set(WallTime time) noexcept { nanoseconds_ = time.time_since_epoch().count(); }

    std::chrono::seconds offset{0};

private:
    std::atomic<std::int64_t> steady_{0};
    std::atomic<std::int64_t> nanoseconds_{1'772'366'400'000'000'000};
};

} // namespace tamblo
