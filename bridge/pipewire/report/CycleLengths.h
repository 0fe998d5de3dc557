#pragma once

#include "bridge/pipewire/graph/Cycle.h"
#include "bridge/pipewire/graph/Graph.h"

#include <cstdint>
#include <unordered_map>

namespace tamblo::pipewire {

/// Has the graph know how many frames a node handles at a time: what the server's settings say is only where
/// it begins, as it goes by what its streams ask for.
class CycleLengths final : public CycleObserver {
public:
    explicit CycleLengths(Graph& graph) : graph_(graph) {}

    void cycleEnded(const Cycle& cycle) override;
    void cyclesRead() override;

private:
    Graph& graph_;
    std::unordered_map<ObjectID, std::uint32_t> frames_; ///< of the nodes with another number than before
};

} // namespace tamblo::pipewire
