#pragma once

#include "bridge/pipewire/graph/Graph.h"

#include <cstdint>
#include <memory>

struct pw_registry;
struct spa_dict;

namespace tamblo::pipewire {

/// An object of the server that more is wanted of than that it exists: it feeds the graph with what the
/// server tells of it, until it is destroyed. The loop's thread.
class BoundObject {
public:
    virtual ~BoundObject() = default;
    BoundObject(const BoundObject&) = delete;
    BoundObject& operator=(const BoundObject&) = delete;

protected:
    BoundObject() = default;
};

/// Null where the server does not give it, as when it is gone already.
[[nodiscard]] std::unique_ptr<BoundObject> bindClient(pw_registry* registry, ObjectID id, Graph& graph);
[[nodiscard]] std::unique_ptr<BoundObject> bindDevice(pw_registry* registry, ObjectID id, Graph& graph);
[[nodiscard]] std::unique_ptr<BoundObject> bindNode(pw_registry* registry, ObjectID id, Graph& graph);
[[nodiscard]] std::unique_ptr<BoundObject> bindMetadata(pw_registry* registry, ObjectID id, Graph& graph);

} // namespace tamblo::pipewire
