#include "bridge/pipewire/graph/Graph.h"

#include <algorithm>

namespace tamblo::pipewire {

namespace {

/// Takes one of the entries away, and the list when it was the last.
template <typename Lists, typename Key> void dropFrom(Lists& lists, const Key& key, ObjectID id) {
    const auto list = lists.find(key);
    if (list == lists.end()) {
        return;
    }
    const auto entry = std::find(list->second.begin(), list->second.end(), id);
    if (entry != list->second.end()) {
        list->second.erase(entry);
    }
    if (list->second.empty()) {
        lists.erase(list);
    }
}

} // namespace

bool Graph::addLink(ObjectID id, Link link) {
    if (links_.contains(id)) {
        removeLink(id);
    }
    if (links_.size() >= kMostLinks) {
        ++leftOut_;
        return false;
    }
    links_.emplace(id, link);
    takers_[link.output].push_back(link.input);
    givers_[link.input].push_back(link.output);
    tell({GraphEvent::Kind::link, GraphEvent::Change::added, id});
    return true;
}

bool Graph::removeLink(ObjectID id) {
    const auto found = links_.find(id);
    if (found == links_.end()) {
        return false;
    }
    dropFrom(takers_, found->second.output, found->second.input);
    dropFrom(givers_, found->second.input, found->second.output);
    return removeFrom(links_, GraphEvent::Kind::link, id);
}

bool Graph::removeNode(ObjectID id) {
    if (!removeFrom(nodes_, GraphEvent::Kind::node, id)) {
        return false;
    }
    for (auto group = groups_.begin(); group != groups_.end();) {
        std::erase(group->second, id);
        group = group->second.empty() ? groups_.erase(group) : std::next(group);
    }
    return true;
}

void Graph::remove(ObjectID id) {
    if (!removeLink(id) && !removeNode(id) && !removeFrom(devices_, GraphEvent::Kind::device, id)) {
        removeFrom(clients_, GraphEvent::Kind::client, id);
    }
}

template <typename Object> void Graph::removeAll(Objects<Object>& objects, GraphEvent::Kind kind) {
    std::vector<ObjectID> ids;
    ids.reserve(objects.size());
    for (const auto& [id, object] : objects) {
        ids.push_back(id);
    }
    std::sort(ids.begin(), ids.end());
    for (const ObjectID id : ids) {
        removeFrom(objects, kind, id);
    }
}

void Graph::clear() {
    takers_.clear();
    givers_.clear();
    removeAll(links_, GraphEvent::Kind::link);
    removeAll(nodes_, GraphEvent::Kind::node);
    groups_.clear();
    removeAll(devices_, GraphEvent::Kind::device);
    removeAll(clients_, GraphEvent::Kind::client);
    changeServer([](Server& server) { server = {}; });
}

std::span<const ObjectID> Graph::groupOf(const Node& node) const {
    const auto found = node.linkGroup.empty() ? groups_.end() : groups_.find(node.linkGroup);
    return found == groups_.end() ? std::span<const ObjectID>() : found->second;
}

ObjectID Graph::nodeNamed(NameHash name) const noexcept {
    const auto found =
        name == kNoName ? nodes_.end() : std::find_if(nodes_.begin(), nodes_.end(), [name](const auto& node) {
            return node.second.nameHash == name;
        });
    return found == nodes_.end() ? kNoObject : found->first;
}

void Graph::regroup(ObjectID node, const std::string& before, const std::string& now) {
    if (before == now) {
        return;
    }
    dropFrom(groups_, before, node);
    if (!now.empty()) {
        groups_[now].push_back(node);
    }
}

void Graph::tell(const GraphEvent& event) {
    for (GraphObserver* const observer : observers_) {
        observer->graphChanged(event);
    }
}

} // namespace tamblo::pipewire
