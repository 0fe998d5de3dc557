#pragma once

#include "bridge/pipewire/graph/Objects.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <unordered_map>
#include <vector>

namespace tamblo::pipewire {

/// What happened to what. A removal is told while the object can still be looked up; anything else when the
/// graph says so already.
struct GraphEvent {
    enum class Kind : std::uint8_t { client, device, node, link, server };
    enum class Change : std::uint8_t { added, changed, removed };

    Kind kind;
    Change change;
    ObjectID id = kNoObject;
};

class GraphObserver {
public:
    virtual ~GraphObserver() = default;
    /// Called inside the change: take note, and do the work when it is due (`Timed`).
    virtual void graphChanged(const GraphEvent& event) = 0;
};

/// A plain model of the sound server's world: who reads the server changes it, who reports observes it. It
/// knows nothing of PipeWire, so that what is decided from it is tested without a server.
///
/// One thread. The number of objects is bounded, whatever the server says: what comes beyond the limits is
/// left out and counted.
class Graph {
public:
    static constexpr std::size_t kMostNodes = 4096;
    static constexpr std::size_t kMostClients = 4096;
    static constexpr std::size_t kMostDevices = 512;
    static constexpr std::size_t kMostLinks = 32768;

    /// Observers are told in the order in which they were added, and outlive the graph's last change.
    void addObserver(GraphObserver& observer) { observers_.push_back(&observer); }
    /// Not from within a change.
    void removeObservers() noexcept { observers_.clear(); }

    /// Changes an object by a function of it, `void(Node&)`, and tells whether it exists, which it does from
    /// the first such call on. Nobody is told of a change that changes nothing.
    template <typename Function> bool changeClient(ObjectID id, Function&& function) {
        return change(GraphEvent::Kind::client, clients_, kMostClients, id, function);
    }
    template <typename Function> bool changeDevice(ObjectID id, Function&& function) {
        return change(GraphEvent::Kind::device, devices_, kMostDevices, id, function);
    }
    template <typename Function> bool changeNode(ObjectID id, Function&& function) {
        return change(GraphEvent::Kind::node, nodes_, kMostNodes, id, function);
    }
    template <typename Function> void changeServer(Function&& function) {
        const Server before = server_;
        function(server_);
        if (!(server_ == before)) {
            tell({GraphEvent::Kind::server, GraphEvent::Change::changed});
        }
    }
    bool addLink(ObjectID id, Link link);
    /// Whatever it is; nothing where there is none.
    void remove(ObjectID id);
    /// The server has gone, and all with it: links first, then nodes, devices and clients.
    void clear();

    [[nodiscard]] const Client* client(ObjectID id) const noexcept { return find(clients_, id); }
    [[nodiscard]] const Device* device(ObjectID id) const noexcept { return find(devices_, id); }
    [[nodiscard]] const Node* node(ObjectID id) const noexcept { return find(nodes_, id); }
    [[nodiscard]] const Link* link(ObjectID id) const noexcept { return find(links_, id); }
    [[nodiscard]] const Server& server() const noexcept { return server_; }
    [[nodiscard]] const std::unordered_map<ObjectID, Node>& nodes() const noexcept { return nodes_; }
    [[nodiscard]] const std::unordered_map<ObjectID, Device>& devices() const noexcept { return devices_; }

    /// The nodes that a node gives to, and those that it takes from: one for each link.
    [[nodiscard]] std::span<const ObjectID> takersFrom(ObjectID node) const noexcept {
        return neighbours(takers_, node);
    }
    [[nodiscard]] std::span<const ObjectID> giversTo(ObjectID node) const noexcept {
        return neighbours(givers_, node);
    }
    /// The nodes of a link group, this one included.
    [[nodiscard]] std::span<const ObjectID> groupOf(const Node& node) const;
    /// `kNoObject` without one.
    [[nodiscard]] ObjectID nodeNamed(NameHash name) const noexcept;

    /// Objects that were left out, as there were too many.
    [[nodiscard]] std::uint64_t leftOut() const noexcept { return leftOut_; }

private:
    template <typename Object> using Objects = std::unordered_map<ObjectID, Object>;
    using Neighbours = std::unordered_map<ObjectID, std::vector<ObjectID>>;

    template <typename Object>
    [[nodiscard]] static const Object* find(const Objects<Object>& objects, ObjectID id) noexcept {
        const auto found = objects.find(id);
        return found == objects.end() ? nullptr : &found->second;
    }
    [[nodiscard]] static std::span<const ObjectID> neighbours(const Neighbours& all, ObjectID node) noexcept {
        const auto found = all.find(node);
        return found == all.end() ? std::span<const ObjectID>() : found->second;
    }

    template <typename Object, typename Function>
    bool change(GraphEvent::Kind kind, Objects<Object>& objects, std::size_t most, ObjectID id,
                Function& function) {
        const auto found = objects.find(id);
        if (found == objects.end() && objects.size() >= most) {
            ++leftOut_;
            return false;
        }
        const bool isNew = found == objects.end();
        Object& object = isNew ? objects[id] : found->second;
        const Object before = object;
        function(object);
        if constexpr (std::is_same_v<Object, Node>) {
            regroup(id, before.linkGroup, object.linkGroup);
        }
        if (isNew || !(object == before)) {
            tell({kind, isNew ? GraphEvent::Change::added : GraphEvent::Change::changed, id});
        }
        return true;
    }
    template <typename Object> bool removeFrom(Objects<Object>& objects, GraphEvent::Kind kind, ObjectID id) {
        if (!objects.contains(id)) {
            return false;
        }
        tell({kind, GraphEvent::Change::removed, id});
        objects.erase(id);
        return true;
    }
    template <typename Object> void removeAll(Objects<Object>& objects, GraphEvent::Kind kind);
    bool removeLink(ObjectID id);
    bool removeNode(ObjectID id);
    void regroup(ObjectID node, const std::string& before, const std::string& now);
    void tell(const GraphEvent& event);

    std::vector<GraphObserver*> observers_;
    Objects<Client> clients_;
    Objects<Device> devices_;
    Objects<Node> nodes_;
    Objects<Link> links_;
    Server server_;
    Neighbours takers_;
    Neighbours givers_;
    std::unordered_map<std::string, std::vector<ObjectID>> groups_;
    std::uint64_t leftOut_ = 0;
};

} // namespace tamblo::pipewire
