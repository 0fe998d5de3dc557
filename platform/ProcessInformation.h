#pragma once

#include <chrono>
#include <optional>
#include <string>

#include <sys/types.h>

namespace tamblo {

/// Figures of this process, of others, and of the system. Any thread; may read a file of the kernel's.
class ProcessInformation {
public:
    virtual ~ProcessInformation() = default;
    [[nodiscard]] virtual pid_t ownProcessIdentifier() const noexcept = 0;
    /// The short name of a process; nothing when it has already exited.
    [[nodiscard]] virtual std::optional<std::string> ProcessNameForPid(pid_t pid) const = 0;
    /// Time since the system started, sleep included.
    [[nodiscard]] virtual std::chrono::duration<double> systemUptime() const noexcept = 0;
    /// Processor time that this process has consumed.
    [[nodiscard]] virtual std::chrono::microseconds processorTime() const noexcept = 0;
};

} // namespace tamblo
