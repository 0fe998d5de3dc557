#pragma once

#include "Processes.h"
#include "Statistics.h"

#include <chrono>

namespace tamblo::bench {

/// Wall time, and the processor time of a process and of this thread, since it was made.
class Meter {
public:
    explicit Meter(pid_t process)
        : process_(process), service_(cpuTimeOf(process)), client_(cpuTimeOfThisThread()) {}

    [[nodiscard]] std::chrono::nanoseconds wall() const { return std::chrono::steady_clock::now() - start_; }
    [[nodiscard]] std::chrono::nanoseconds service() const { return cpuTimeOf(process_) - service_; }
    [[nodiscard]] std::chrono::nanoseconds client() const { return cpuTimeOfThisThread() - client_; }

private:
    pid_t process_;
    std::chrono::nanoseconds service_;
    std::chrono::nanoseconds client_;
    std::chrono::steady_clock::time_point start_ = std::chrono::steady_clock::now();
};

} // namespace tamblo::bench
