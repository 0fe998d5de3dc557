#pragma once

#include "platform/ProcessInformation.h"

#include <array>
#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <variant>

namespace tamblo {

/// Figures that a test sets.
class FakeProcessInformation final : public ProcessInformation {
public:
    [[nodiscard]] pid_t ownProcessIdentifier() const noexcept override { return own; }
    [[nodiscard]] std::optional<std::string> ProcessNameForPid(pid_t pid) const override {
        const auto found = names.find(pid);
        return found != names.end() ? std::optional(found->second) : std::nullopt;
    }
    [[nodiscard]] std::chrono::duration<double> systemUptime() const noexcept override { return uptime; }
    [[nodiscard]] std::chrono::microseconds processorTime() const noexcept override { return consumed; }

    [[nodiscard]] std::variant<std::uint64_t, QueryError> physicalFootprint() const override {
        return footprint;
    }
    [[nodiscard]] std::array<double, 3> loadAverages() const override { return loads; }

    pid_t own = 4321;
    std::map<pid_t, std::string> names;
    std::chrono::duration<double> uptime{1000.0};
    std::chrono::microseconds consumed{0};
    std::variant<std::uint64_t, QueryError> footprint = std::uint64_t{3} << 20U;
    std::array<double, 3> loads{0.5, 0.25, 0.125};
};

} // namespace tamblo
