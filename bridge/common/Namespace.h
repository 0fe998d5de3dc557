#pragma once

namespace tamblo {

namespace pipewire {}

/// What the programs share that feed the service from something that exists.
namespace bridge = pipewire;

} // namespace tamblo
