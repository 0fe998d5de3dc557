#include "platform/linux/LinuxClock.h"

namespace tamblo {

WallTime LinuxClock::now() const noexcept {
    return std::chrono::system_clock::now();
}

} // namespace tamblo
