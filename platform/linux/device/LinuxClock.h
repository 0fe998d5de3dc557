#pragma once

#include "base/Mutex.h"
#include "os/ThreadTime.h"
#include "platform/Clock.h"

#include <ctime>
#include <thread>

namespace tamblo {

/// The system's real-time clock, read without entering the kernel, and the time zone that the device has
/// when asked.
class LinuxClock final : public Clock {
public:
    [[nodiscard]] WallTime now() const noexcept override { return std::chrono::system_clock::now(); }
    [[nodiscard]] WallTime coarseNow() const noexcept override {
        std::timespec time{};
        ::clock_gettime(CLOCK_REALTIME_COARSE, &time);
        return WallTime(std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec));
    }
    [[nodiscard]] std::chrono::nanoseconds threadTime() const noexcept override {
        return tamblo::threadTime();
    }
    [[nodiscard]] std::chrono::seconds utcOffset(WallTime time) const override {
        const std::time_t seconds = std::chrono::floor<std::chrono::seconds>(time.time_since_epoch()).count();
        const MutexLock lock(zone_);
        ::tzset(); // `localtime_r` alone stays in the zone that the process began in
        std::tm local{};
        return std::chrono::seconds(::localtime_r(&seconds, &local) != nullptr ? local.tm_gmtoff : 0);
    }
    void sleepFor(std::chrono::microseconds time) override { std::this_thread::sleep_for(time); }

private:
    mutable Mutex zone_; ///< held while the C library's zone, which is the whole process's, is read
};

} // namespace tamblo
