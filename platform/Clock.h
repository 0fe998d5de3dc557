#pragma once

#include <chrono>

namespace tamblo {

/// A point of civil time. Payloads carry it as seconds since 1970 in a double.
using WallTime = std::chrono::time_point<std::chrono::system_clock, std::chrono::nanoseconds>;

[[nodiscard]] constexpr double secondsSince1970(WallTime time) noexcept {
    return std::chrono::duration<double>(time.time_since_epoch()).count();
}

/// The time, on any thread.
class Clock {
public:
    virtual ~Clock() = default;
    /// The time of day, which may step backwards. Without blocking.
    [[nodiscard]] virtual WallTime now() const noexcept = 0;
    /// The same to some milliseconds, for a fraction of what reading the time costs.
    [[nodiscard]] virtual WallTime coarseNow() const noexcept { return now(); }
    /// Time that only ever goes on, for how long something took.
    [[nodiscard]] virtual std::chrono::steady_clock::time_point steadyNow() const noexcept {
        return std::chrono::steady_clock::now();
    }
    /// How long the processor has worked for the calling thread. May cost a microsecond.
    [[nodiscard]] virtual std::chrono::nanoseconds threadTime() const noexcept {
        return steadyNow().time_since_epoch();
    }
    /// How far the device's local time is ahead of UTC at that time. May read the zone from the disk.
    [[nodiscard]] virtual std::chrono::seconds utcOffset(WallTime time) const = 0;
    /// Holds up the calling thread for that long.
    virtual void sleepFor(std::chrono::microseconds time) = 0;
};

} // namespace tamblo
