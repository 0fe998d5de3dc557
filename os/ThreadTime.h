#pragma once

#include <chrono>
#include <ctime>

namespace tamblo {

/// How long the processor has worked for the calling thread. Enters the kernel, which may cost a microsecond.
[[nodiscard]] inline std::chrono::nanoseconds threadTime() noexcept {
    std::timespec time{};
    ::clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
    return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

} // namespace tamblo
