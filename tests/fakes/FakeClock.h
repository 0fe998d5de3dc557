#pragma once

#include "platform/Clock.h"

#include <atomic>
#include <chrono>

namespace tamblo {

/// Time that stands still until a test turns it; begins in March 2026.
class FakeClock final : public Clock {
public:
    [[nodiscard]] WallTime now() const noexcept override {
        return WallTime(std::chrono::nanoseconds(nanoseconds_.load(std::memory_order_relaxed)));
    }
    [[nodiscard]] double seconds() const noexcept { return secondsSince1970(now()); }
    [[nodiscard]] std::chrono::seconds utcOffset(WallTime) const override { return offset; }
    void sleepFor(std::chrono::microseconds time) override { advance(time); }
    void advance(std::chrono::nanoseconds step) noexcept { nanoseconds_ += step.count(); }
    void set(WallTime time) noexcept { nanoseconds_ = time.time_since_epoch().count(); }

    std::chrono::seconds offset{0};

private:
    std::atomic<std::int64_t> nanoseconds_{1'772'366'400'000'000'000};
};

} // namespace tamblo
