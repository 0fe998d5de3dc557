#pragma once

#include "platform/ProcessInformation.h"

namespace tamblo {

/// Process figures from `/proc` and the kernel's clocks. Stateless.
class LinuxProcessInformation final : public ProcessInformation {
public:
    [[nodiscard]] pid_t ownProcessIdentifier() const noexcept override;
    /// At most 15 bytes, as the kernel keeps it; always UTF-8, whatever the process calls itself.
    [[nodiscard]] std::optional<std::string> ProcessNameForPid(pid_t pid) const override;
    [[nodiscard]] std::chrono::duration<double> systemUptime() const noexcept override;
    [[nodiscard]] std::chrono::microseconds processorTime() const noexcept override;
    [[nodiscard]] std::variant<std::uint64_t, QueryError> physicalFootprint() const override;
    [[nodiscard]] std::array<double, 3> loadAverages() const override;
};

} // namespace tamblo
