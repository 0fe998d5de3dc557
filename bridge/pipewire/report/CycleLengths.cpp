#include "bridge/pipewire/report/CycleLengths.h"

namespace tamblo::pipewire {

void CycleLengths::cycleEnded(const Cycle& cycle) {
    for (const NodeCycle& node : cycle.nodes) {
        const Node* const known = graph_.node(node.node);
        if (known == nullptr || node.outcome == NodeCycle::Outcome::waited) {
            continue;
        }
        if (known->quantum == cycle.frames) {
            frames_.erase(node.node);
        } else if (cycle.frames != 0) {
            frames_[node.node] = cycle.frames;
        }
    }
}

/// Only what a node came to is said, as a graph that finds its pace may go through several.
void CycleLengths::cyclesRead() {
    for (const auto& [id, frames] : frames_) {
        if (graph_.node(id) != nullptr) {
            graph_.changeNode(id, [quantum = frames](Node& node) { node.quantum = quantum; });
        }
    }
    frames_.clear();
}

} // namespace tamblo::pipewire
