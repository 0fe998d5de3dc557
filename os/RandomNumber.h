#pragma once

#include <chrono>
#include <cstdint>

#include <sys/random.h>

namespace tamblo {

/// A number that another start of the process hardly has, too. Does not block: early in the device's start,
/// when there is no randomness yet, it is the time.
[[nodiscard]] inline std::uint64_t randomNumber() noexcept {
    std::uint64_t number = 0;
    if (::getrandom(&number, sizeof number, GRND_NONBLOCK) != sizeof number) {
        number = static_cast<std::uint64_t>(std::chrono::system_clock::now().time_since_epoch().count());
    }
    return number;
}

} // namespace tamblo
