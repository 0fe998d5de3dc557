#pragma once

#include <array>
#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <variant>

#include <sys/types.h>

namespace tamblo {

/// Figures of this process, of others, and of the system. Any thread; may read a file of the kernel's.
class ProcessInformation {
public:
    /// Why a figure could not be had.
    struct QueryError {
        int code = 0;
        std::string text;
    };

    virtual ~ProcessInformation() = default;
    [[nodiscard]] virtual pid_t ownProcessIdentifier() const noexcept = 0;
    /// The short name of a process; nothing when it has already exited.
    [[nodiscard]] virtual std::optional<std::string> ProcessNameForPid(pid_t pid) const = 0;
    /// Time since the system started, sleep included.
    [[nodiscard]] virtual std::chrono::duration<double> systemUptime() const noexcept = 0;
    /// Processor time that this process has consumed.
    [[nodiscard]] virtual std::chrono::microseconds processorTime() const noexcept = 0;
    /// Bytes of memory that the system holds for this process alone, swapped ones included.
    [[nodiscard]] virtual std::variant<std::uint64_t, QueryError> physicalFootprint() const = 0;
    /// How many processes were running or waiting for a disk, averaged over 1, 5 and 15 minutes; 0 where that
    /// is not known.
    [[nodiscard]] virtual std::array<double, 3> loadAverages() const = 0;
    /// Gives memory that this process has freed back to the system, which takes milliseconds.
    virtual void giveBackMemory() const noexcept = 0;
};

} // namespace tamblo
