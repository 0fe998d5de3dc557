#pragma once

#include "Bench.h"

#include <cstdint>
#include <span>
#include <string_view>

namespace tamblo::bench {

/// What the figures of a scenario depend on: on no storage at all, on one that is the same each time (a disk
/// where there is one), or on each, as the service's writing is what is measured.
enum class Storages : std::uint8_t { none, one, each };

struct Scenario {
    std::string_view name;
    std::string_view what;
    void (*run)(Bench& bench);
    Storages storages = Storages::one;
    bool isRunUnasked = true;

    /// Without a service.
    [[nodiscard]] bool isFloor() const noexcept { return name.starts_with("floor_"); }
};

[[nodiscard]] std::span<const Scenario> allScenarios();

} // namespace tamblo::bench
