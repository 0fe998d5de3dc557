#pragma once

#include "bridge/pipewire/graph/Graph.h"

#include <string>
#include <vector>

namespace tamblo::pipewire {

/// Where a stream's sound goes to, or comes from.
struct Reached {
    std::vector<ObjectID> devices; ///< sinks or sources, each once, ascending
    std::vector<ObjectID> filters; ///< what lies between, each once, in the order of the way
    /// Whether anything at all is linked to the stream, on the side that its sound takes.
    bool isLinked = false;

    bool operator==(const Reached&) const = default;
};

/// Follows the links from a stream: downstream of one that plays, upstream of one that records.
///
/// A filter is a node that gives on what it takes, or two nodes of one link group, of which one takes and the
/// other gives; a virtual sink or source counts as one where links lead on from it to a device, and else as a
/// device itself. Other applications' streams end the way without being a device. Circles are walked once,
/// and at most `kMostSteps` nodes are.
inline constexpr std::size_t kMostSteps = 256;
[[nodiscard]] Reached devicesReachedFrom(const Graph& graph, ObjectID stream);

/// What of a sink or source matters to people and to reports.
struct DeviceFacts {
    std::string name; ///< as a person knows it
    std::string portType;
    std::string formFactor;
    std::string bluetoothProfile;
    std::string bluetoothCodec;
    std::uint32_t rate = 0; ///< Hz; 0: not known
    Volume volume;
};
/// `isMonitored`: the sound is taken from what a sink plays.
[[nodiscard]] DeviceFacts factsOf(const Graph& graph, ObjectID sinkOrSource, bool isMonitored = false);

/// A filter's name without the piece of hardware that it may have been called after: of what is on USB the
/// server's names have the serial number.
[[nodiscard]] std::string filterName(const Node& filter);

} // namespace tamblo::pipewire
