#pragma once

#include "base/Dictionary.h"
#include "bridge/pipewire/graph/Graph.h"

namespace tamblo::pipewire {

/// What there is to say of a stream at a moment.
struct StreamSettings {
    bool isRunning = false;
    /// Everything else, with the keys that summaries are derived from (`docs/messages.md`) and more of this
    /// program's own (`docs/pipewire.md`).
    Dictionary settings;
};

/// Of a stream of the graph.
[[nodiscard]] StreamSettings settingsOf(const Graph& graph, ObjectID stream);

/// The volume that people see for a factor of the signal: its cube root, from 0 to 1.
[[nodiscard]] double perceivedVolume(double linear) noexcept;

/// The entries of `now` that `before` has not, or has with another value.
[[nodiscard]] Dictionary changesBetween(const Dictionary& before, const Dictionary& now);

} // namespace tamblo::pipewire
