#pragma once

#include "platform/ProcessInformation.h"
#include "platform/ProcessSampling.h"
#include "platform/linux/device/ProcessFiles.h"
#include "platform/linux/device/RecentReading.h"

#include <chrono>
#include <string>

#include <unistd.h>

namespace tamblo {

/// Process figures from `/proc` and the kernel's clocks.
class LinuxProcessInformation final : public ProcessInformation {
public:
    /// How long a footprint is kept.
    static constexpr std::chrono::milliseconds kValidity{100};

    explicit LinuxProcessInformation(std::string root = "/proc",
                                     SteadyNow now = &std::chrono::steady_clock::now);

    [[nodiscard]] pid_t ownProcessIdentifier() const noexcept override { return ::getpid(); }
    /// At most 15 bytes, as the kernel keeps it; always UTF-8, whatever the process calls itself.
    [[nodiscard]] std::optional<std::string> ProcessNameForPid(pid_t pid) const override {
        return files_.name(pid);
    }
    [[nodiscard]] std::chrono::duration<double> systemUptime() const noexcept override;
    [[nodiscard]] std::chrono::microseconds processorTime() const noexcept override;
    /// Anonymous and shared memory, resident or swapped out. Pages of files do not count: the system can drop
    /// them at any time and read them again. An error's code is an `errno`.
    [[nodiscard]] std::variant<std::uint64_t, QueryError> physicalFootprint() const override;
    [[nodiscard]] std::array<double, 3> loadAverages() const override;
    void giveBackMemory() const noexcept override;

private:
    const ProcessFiles files_;
    mutable RecentReading<std::variant<std::uint64_t, QueryError>> footprint_;
};

/// What processes have used, from `/proc`.
class LinuxProcessSampling final : public ProcessSampling {
public:
    [[nodiscard]] std::optional<ProcessSample> sample(pid_t pid) const override { return files_.sample(pid); }

private:
    const ProcessFiles files_;
};

} // namespace tamblo
