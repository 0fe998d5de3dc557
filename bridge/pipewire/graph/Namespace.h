#pragma once

namespace tamblo {

/// What the programs share that feed the service from something that exists.
namespace bridge {}

/// The program that watches PipeWire.
namespace pipewire {
using namespace bridge;
}

} // namespace tamblo
