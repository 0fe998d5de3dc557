#pragma once

#include "bridge/common/tests/KeptReports.h"
#include "bridge/pipewire/graph/Graph.h"
#include "bridge/pipewire/graph/Namespace.h"
#include "bridge/pipewire/graph/Properties.h"

#include <initializer_list>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo::pipewire::test {

using namespace bridge::test;

using Properties = std::initializer_list<std::pair<std::string_view, std::string_view>>;

/// A graph, and how to put things into it as the server's side does.
struct World {
    void node(ObjectID id, Properties properties, NodeState state = NodeState::running) {
        graph.changeNode(id, [&](Node& node) {
            node.isKnown = true;
            node.state = state;
            for (const auto& [key, value] : properties) {
                takeProperty(node, key, value);
            }
        });
    }
    void stream(ObjectID id, Properties properties = {}) {
        node(id, {{"media.class", "Stream/Output/Audio"}});
        node(id, properties);
    }
    void sink(ObjectID id, std::string_view name) {
        node(id, {{"media.class", "Audio/Sink"}, {"node.description", name}});
    }
    void link(ObjectID from, ObjectID to) { graph.addLink(1000 * from + to, {.output = from, .input = to}); }
    void unlink(ObjectID from, ObjectID to) { graph.remove(1000 * from + to); }

    Graph graph;
};

} // namespace tamblo::pipewire::test
