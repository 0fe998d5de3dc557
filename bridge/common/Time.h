#pragma once

#include <chrono>
#include <optional>

namespace tamblo::bridge {

using SteadyTime = std::chrono::steady_clock::time_point;
using WallTime = std::chrono::system_clock::time_point;

/// One moment by both clocks: lengths are had from the one, timestamps from the other.
struct Moment {
    SteadyTime steady;
    WallTime wall;
};

/// Where the time comes from, so that tests can turn it.
class Clock {
public:
    virtual ~Clock() = default;
    [[nodiscard]] virtual Moment now() const = 0;
};

class SystemClock final : public Clock {
public:
    [[nodiscard]] Moment now() const override {
        return {std::chrono::steady_clock::now(), std::chrono::system_clock::now()};
    }
};

/// Something that has work to do at a time. The loop sleeps until the earliest such time or an event, asks
/// all of them each time that it wakes, and never wakes while nobody has a time.
class Timed {
public:
    virtual ~Timed() = default;
    /// Nothing while there is nothing to do.
    [[nodiscard]] virtual std::optional<SteadyTime> due() const = 0;
    /// Called when it is due, or later.
    virtual void run() = 0;
};

/// Has something due at that time, if it is not due before.
inline void bringForward(std::optional<SteadyTime>& due, std::optional<SteadyTime> time) {
    if (time && (!due || *time < *due)) {
        due = time;
    }
}

/// Seconds since 1970, as payloads have them.
[[nodiscard]] inline double secondsSince1970(WallTime time) noexcept {
    return std::chrono::duration<double>(time.time_since_epoch()).count();
}

} // namespace tamblo::bridge
