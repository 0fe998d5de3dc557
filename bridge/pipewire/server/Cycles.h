#pragma once

#include "bridge/pipewire/graph/Cycle.h"

#include <span>

struct spa_pod;

namespace tamblo::pipewire {

/// Reads what the server's profiler gives, cycles one after another, and tells of each. What does not have
/// the shape that it should is passed over.
void readCycles(const spa_pod* profile, std::span<CycleObserver* const> observers);

} // namespace tamblo::pipewire
