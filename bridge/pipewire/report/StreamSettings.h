#pragma once

#include "bridge/common/Settings.h"
#include "bridge/pipewire/graph/Graph.h"
#include "bridge/pipewire/graph/Namespace.h"

namespace tamblo::pipewire {

/// Of a stream of the graph.
[[nodiscard]] StreamSettings settingsOf(const Graph& graph, ObjectID stream);

} // namespace tamblo::pipewire
