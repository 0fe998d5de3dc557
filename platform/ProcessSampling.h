#pragma once

#include <chrono>
#include <cstdint>
#include <optional>

#include <sys/types.h>

namespace tamblo {

/// What a process has used since it began, and what it holds now.
struct ProcessSample {
    std::chrono::microseconds userTime{0};
    std::chrono::microseconds systemTime{0};
    std::uint64_t voluntarySwitches = 0;
    std::uint64_t involuntarySwitches = 0;
    std::uint64_t minorFaults = 0;
    std::uint64_t majorFaults = 0; ///< those that waited for a disk
    std::uint64_t residentBytes = 0;
    std::uint64_t threads = 0;
};

/// Figures of any process. Any thread; reads files of the kernel's and waits for nothing else.
class ProcessSampling {
public:
    virtual ~ProcessSampling() = default;
    /// Nothing for a process that has ended or may not be looked at.
    [[nodiscard]] virtual std::optional<ProcessSample> sample(pid_t pid) const = 0;
};

} // namespace tamblo
