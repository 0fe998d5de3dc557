#pragma once

#include "bridge/common/Reporter.h"
#include "bridge/pipewire/graph/Namespace.h"
#include "bridge/pipewire/graph/Objects.h"

#include <functional>

namespace tamblo::pipewire {

/// The session that something about a node belongs to; `kNoSession` without one.
using SessionOfNode = std::function<SessionID(ObjectID node)>;

} // namespace tamblo::pipewire
