#include "bridge/pipewire/graph/Routes.h"

#include <algorithm>
#include <string_view>
#include <unordered_set>

namespace tamblo::pipewire {

namespace {

/// A walk from one stream in one direction.
class Walk {
public:
    Walk(const Graph& graph, bool isDownstream) : graph_(graph), isDownstream_(isDownstream) {}

    Reached from(ObjectID stream) {
        visited_.insert(stream);
        Reached reached;
        reached.isLinked = !next(stream).empty();
        walkOn(stream, reached);
        std::sort(reached.devices.begin(), reached.devices.end());
        return reached;
    }

private:
    [[nodiscard]] std::span<const ObjectID> next(ObjectID node) const {
        return isDownstream_ ? graph_.takersFrom(node) : graph_.giversTo(node);
    }

    void walkOn(ObjectID from, Reached& reached) {
        for (const ObjectID id : next(from)) {
            visit(id, reached);
        }
    }

    void visit(ObjectID id, Reached& reached) {
        if (visited_.size() > kMostSteps || !visited_.insert(id).second) {
            return;
        }
        const Node* const node = graph_.node(id);
        if (node == nullptr) {
            walkOn(id, reached);
        } else if (!node->linkGroup.empty() && passThrough(id, *node, reached)) {
            return;
        } else if (node->isDevice()) {
            reachDevice(id, *node, reached);
        } else if (node->mediaClass == MediaClass::other) {
            reached.filters.push_back(id);
            walkOn(id, reached);
        }
    }

    /// Goes on from the other side of a filter. False where it has none: then it is an end.
    bool passThrough(ObjectID id, const Node& node, Reached& reached) {
        const MediaClass otherSide = isDownstream_ ? MediaClass::playbackStream : MediaClass::captureStream;
        bool hasOtherSide = false;
        for (const ObjectID sibling : graph_.groupOf(node)) {
            const Node* const other = graph_.node(sibling);
            if (sibling == id || other == nullptr || other->mediaClass != otherSide) {
                continue;
            }
            if (!hasOtherSide) {
                reached.filters.push_back(id);
                hasOtherSide = true;
            }
            if (visited_.size() <= kMostSteps && visited_.insert(sibling).second) {
                walkOn(sibling, reached);
            }
        }
        return hasOtherSide;
    }

    /// A virtual one is a device itself unless links lead on to others.
    void reachDevice(ObjectID id, const Node& node, Reached& reached) {
        const bool mayLeadOn =
            node.isVirtual && node.mediaClass == (isDownstream_ ? MediaClass::sink : MediaClass::source);
        if (mayLeadOn) {
            const std::size_t devices = reached.devices.size();
            const std::size_t filters = reached.filters.size();
            reached.filters.push_back(id);
            walkOn(id, reached);
            if (reached.devices.size() > devices) {
                return;
            }
            reached.filters.resize(filters);
        }
        reached.devices.push_back(id);
    }

    const Graph& graph_;
    const bool isDownstream_;
    std::unordered_set<ObjectID> visited_;
};

const Route* routeOf(const Device& device, const Node& node) noexcept {
    const bool isOutput = node.mediaClass == MediaClass::sink;
    const auto found =
        std::find_if(device.routes.begin(), device.routes.end(), [&node, isOutput](const Route& route) {
            return route.isOutput == isOutput && (!node.endOfDevice || route.end == *node.endOfDevice);
        });
    return found == device.routes.end() ? nullptr : &*found;
}

std::string firstOf(std::initializer_list<std::string_view> texts) {
    for (const std::string_view text : texts) {
        if (!text.empty()) {
            return std::string(text);
        }
    }
    return {};
}

std::string nameOf(const Node& node, const Device* device, const Route* route) {
    std::string whole = firstOf({node.description, node.nick, device == nullptr ? "" : device->description,
                                 device == nullptr ? "" : device->nick});
    if (whole.empty()) {
        return node.mediaClass == MediaClass::source ? "Unnamed source" : "Unnamed sink";
    }
    if (route == nullptr || route->description.empty() || route->description == whole) {
        return whole;
    }
    const std::string_view what = device->description.empty() ? std::string_view(whole) : device->description;
    return route->description == what ? whole : route->description + " - " + std::string(what);
}

} // namespace

Reached devicesReachedFrom(const Graph& graph, ObjectID stream) {
    const Node* const node = graph.node(stream);
    return Walk(graph, node == nullptr || node->mediaClass != MediaClass::captureStream).from(stream);
}

/// "alsa_output.usb-Maker_Thing_0123-00.analog-stereo.remapped": which part is the number cannot be told.
std::string filterName(const Node& filter) {
    constexpr std::string_view kUsb = "usb-";
    std::string name = filter.name;
    for (auto begin = name.find(kUsb); begin != name.npos; begin = name.find(kUsb, begin + kUsb.size())) {
        const std::size_t end = std::min(name.find('.', begin), name.size());
        name.erase(begin + kUsb.size(), end - begin - kUsb.size());
    }
    return name;
}

DeviceFacts factsOf(const Graph& graph, ObjectID sinkOrSource, bool isMonitored) {
    DeviceFacts facts;
    const Node* const node = graph.node(sinkOrSource);
    if (node == nullptr) {
        return facts;
    }
    const Device* const device = graph.device(node->device);
    const Route* const route = device == nullptr ? nullptr : routeOf(*device, *node);
    facts.name = (isMonitored ? "Monitor of " : "") + nameOf(*node, device, route);
    facts.portType = route == nullptr ? "" : route->portType;
    facts.formFactor = firstOf({node->formFactor, device == nullptr ? "" : device->formFactor});
    facts.bluetoothProfile = node->bluetoothProfile;
    facts.bluetoothCodec = node->bluetoothCodec;
    facts.rate = node->format ? node->format->rate : graph.server().rateInForce();
    facts.volume = node->volume.value_or(Volume{});
    return facts;
}

} // namespace tamblo::pipewire
