#include "platform/linux/device/LinuxClock.h"

#include <ctime>
#include <thread>

namespace tamblo {

WallTime LinuxClock::now() const noexcept {
    return std::chrono::system_clock::now();
}

std::chrono::seconds LinuxClock::utcOffset(WallTime time) const {
    const std::time_t seconds = std::chrono::floor<std::chrono::seconds>(time.time_since_epoch()).count();
    const MutexLock lock(zone_);
    ::tzset(); // `localtime_r` alone stays in the zone that the process began in
    std::tm local{};
    return std::chrono::seconds(::localtime_r(&seconds, &local) != nullptr ? local.tm_gmtoff : 0);
}

void LinuxClock::sleepFor(std::chrono::microseconds time) {
    std::this_thread::sleep_for(time);
}

} // namespace tamblo
