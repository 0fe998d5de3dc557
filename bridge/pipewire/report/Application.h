#pragma once

#include "bridge/pipewire/graph/Objects.h"

#include <string>

namespace tamblo::pipewire {

/// What an application is reported as: the identifier that a sandbox vouches for, which only clients have,
/// else its own identifier, else the binary, else its name, each as the stream says it or else its client.
/// "Unknown" without any.
[[nodiscard]] std::string applicationOf(const Node& stream, const Client* client);

} // namespace tamblo::pipewire
