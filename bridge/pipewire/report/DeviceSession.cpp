#include "bridge/pipewire/report/DeviceSession.h"

#include "bridge/pipewire/graph/Routes.h"
#include "bridge/pipewire/report/StreamSettings.h"

#include <string>
#include <utility>

namespace tamblo::pipewire {

namespace {

constexpr std::string_view kApplication = "pipewire";
constexpr std::string_view kDefaultOutput = "default_output";
constexpr std::string_view kDefaultInput = "default_input";

constexpr EventCategory kServer = client::category(Subsystem::hal, EventKind::generic);
constexpr EventCategory kDevice = client::category(Subsystem::hal, EventKind::setup);
constexpr EventCategory kRouteChange = client::category(Subsystem::routing, EventKind::routeChange);

/// One of the two default devices; "None" without one.
void setDefault(Dictionary& settings, const Graph& graph, std::string_view key, NameHash nodeName) {
    const std::string prefix(key);
    const ObjectID id = graph.nodeNamed(nodeName);
    const Node* const node = graph.node(id);
    const bool isMonitored = key == kDefaultInput && node != nullptr && node->mediaClass == MediaClass::sink;
    const DeviceFacts facts = factsOf(graph, id, isMonitored);
    settings.set(prefix, id == kNoObject ? "None" : facts.name);
    settings.set(prefix + "_port_type", facts.portType);
    settings.set(prefix + "_form_factor", facts.formFactor);
    settings.set(prefix + "_bluetooth_profile", facts.bluetoothProfile);
    settings.set(prefix + "_bluetooth_codec", facts.bluetoothCodec);
}

Dictionary serverSettings(const Graph& graph) {
    const Server& server = graph.server();
    Dictionary settings{{"server_version", server.version},
                        {"sample_rate", server.rateInForce()},
                        {"io_buffer_size", server.quantumInForce()}};
    setDefault(settings, graph, kDefaultOutput, server.defaultSink);
    setDefault(settings, graph, kDefaultInput, server.defaultSource);
    return settings;
}

Dictionary settingsOfCard(const Device& device) {
    return {{"device", device.description.empty() ? device.nick : device.description},
            {"device_kind", "card"},
            {"device_api", device.api},
            {"device_bus", device.bus},
            {"device_vendor", device.vendor},
            {"device_product", device.product},
            {"form_factor", device.formFactor},
            {"profile", device.profile},
            {"profile_description", device.profileDescription}};
}

Dictionary settingsOfNode(const Graph& graph, ObjectID id, const Node& node) {
    const DeviceFacts facts = factsOf(graph, id);
    const bool isSink = node.mediaClass == MediaClass::sink;
    const bool isSource = node.mediaClass == MediaClass::source;
    return {{"device", facts.name},
            {"device_kind", isSink     ? "sink"
                            : isSource ? "source"
                                       : "duplex"},
            {"port_type", facts.portType},
            {"form_factor", facts.formFactor},
            {"bluetooth_profile", facts.bluetoothProfile},
            {"bluetooth_codec", facts.bluetoothCodec},
            {"device_sample_rate", node.format ? node.format->rate : 0U}};
}

std::map<ObjectID, Dictionary> devicesOf(const Graph& graph) {
    std::map<ObjectID, Dictionary> all;
    for (const auto& [id, device] : graph.devices()) {
        if (device.isKnown) {
            all.emplace(id, settingsOfCard(device));
        }
    }
    for (const auto& [id, node] : graph.nodes()) {
        if (node.isDevice() && node.isKnown) {
            all.emplace(id, settingsOfNode(graph, id, node));
        }
    }
    return all;
}

bool isUnknown(const Value& value) noexcept {
    return value.isString() ? value.stringValue().empty() : value.integerValue() == 0;
}

Dictionary known(const Dictionary& settings) {
    Dictionary rest;
    for (std::size_t i = 0; i < settings.size(); ++i) {
        if (!isUnknown(settings.valueAt(i))) {
            rest.set(settings.keyAt(i), settings.valueAt(i));
        }
    }
    return rest;
}

/// A change, with what was there before under "previous_…".
void setChange(Dictionary& payload, const Dictionary& before, std::string_view key, const Value& now) {
    payload.set(key, now);
    const Value* const previous = before.find(key);
    if (previous != nullptr && !isUnknown(*previous)) {
        payload.set("previous_" + std::string(key), *previous);
    }
}

} // namespace

void DeviceSession::graphChanged(const GraphEvent& event) {
    if (event.kind == GraphEvent::Kind::client || event.kind == GraphEvent::Kind::link) {
        return;
    }
    const Node* const node = event.kind == GraphEvent::Kind::node ? graph_.node(event.id) : nullptr;
    if (!changedAt_ && (node == nullptr || node->isDevice())) {
        changedAt_ = clock_.now();
    }
}

void DeviceSession::reporterCame() {
    changedAt_ = clock_.now();
}

void DeviceSession::reporterWent() {
    forget();
}

void DeviceSession::forget() {
    id_ = kNoSession;
    begun_.reset();
    hasBeenThere_ = false;
    restarts_ = messages_ = 0;
    server_ = {};
    devices_.clear();
}

std::optional<SteadyTime> DeviceSession::due() const {
    std::optional<SteadyTime> due;
    if (changedAt_) {
        due = changedAt_->steady + kSettling;
    }
    if (begun_) {
        bringForward(due, begun_->steady + kLength);
    }
    return due;
}

/// A day is over by either clock: the one stands still while the machine sleeps, the other may be set.
void DeviceSession::run() {
    const Moment now = clock_.now();
    if (begun_ && (now.steady - begun_->steady >= kLength || now.wall - begun_->wall >= kLength)) {
        end();
        changedAt_ = now;
        settle();
    } else if (changedAt_ && now.steady - changedAt_->steady >= kSettling) {
        settle();
    }
}

void DeviceSession::end() {
    if (id_ != kNoSession) {
        reporter_.end(id_);
    }
    forget();
}

void DeviceSession::settle() {
    if (!changedAt_) {
        return;
    }
    const Moment at = *std::exchange(changedAt_, std::nullopt);
    const bool isThere = !graph_.server().version.empty();
    if (id_ == kNoSession && isThere) {
        begin(at);
    }
    if (id_ == kNoSession) {
        return;
    }
    if (!isThere && std::exchange(wasThere_, false)) {
        say(kServer, EventType::stop, {{"server_running", false}}, at);
        server_ = {};
        devices_.clear();
    }
    if (isThere) {
        sayServer(serverSettings(graph_), at);
        sayDevices(devicesOf(graph_), at);
    }
}

void DeviceSession::begin(const Moment& at) {
    id_ = reporter_.begin(ServiceType::audioDeviceUsage, std::string(kApplication));
    if (id_ != kNoSession) {
        begun_ = at;
        wasThere_ = false;
    }
}

void DeviceSession::sayServer(const Dictionary& now, const Moment& at) {
    const Dictionary before = std::exchange(server_, now);
    if (!std::exchange(wasThere_, true)) {
        restarts_ += std::exchange(hasBeenThere_, true) ? 1 : 0;
        Dictionary payload = known(now);
        payload.set("server_running", true);
        payload.set("server_restarts", restarts_);
        say(kServer, EventType::start, std::move(payload), at);
        return;
    }
    Dictionary routes;
    Dictionary clock;
    const Dictionary changes = changesBetween(before, now);
    for (std::size_t i = 0; i < changes.size(); ++i) {
        const std::string_view key = changes.keyAt(i);
        setChange(key.starts_with("default_") ? routes : clock, before, key, changes.valueAt(i));
    }
    if (!routes.empty()) {
        say(kRouteChange, EventType::generic, std::move(routes), at);
    }
    if (!clock.empty()) {
        say(kDevice, EventType::generic, std::move(clock), at);
    }
}

void DeviceSession::sayDevices(const Devices& now, const Moment& at) {
    std::size_t count = 0;
    for (auto old = devices_.begin(); old != devices_.end() && count < kMostMessages;) {
        if (now.contains(old->first)) {
            ++old;
            continue;
        }
        ++count;
        say(kDevice, EventType::deactivate, known(old->second), at);
        old = devices_.erase(old);
    }
    for (auto device = now.begin(); device != now.end() && count < kMostMessages; ++device) {
        const auto [said, isNew] = devices_.try_emplace(device->first, device->second);
        if (isNew) {
            ++count;
            say(kDevice, EventType::activate, known(device->second), at);
            continue;
        }
        const Dictionary changes = changesBetween(said->second, device->second);
        if (changes.empty()) {
            continue;
        }
        ++count;
        Dictionary payload{{"device", *device->second.find("device")},
                           {"device_kind", *device->second.find("device_kind")}};
        for (std::size_t i = 0; i < changes.size(); ++i) {
            setChange(payload, said->second, changes.keyAt(i), changes.valueAt(i));
        }
        said->second = device->second;
        say(kDevice, EventType::generic, std::move(payload), at);
    }
    if (count >= kMostMessages) {
        changedAt_ = at;
        changedAt_->steady = clock_.now().steady;
    }
}

/// The number tells repeated messages apart: the service leaves out one that repeats the last of its kind,
/// as the default devices that are found after each restart of the server.
void DeviceSession::say(EventCategory category, EventType type, Dictionary payload, const Moment& at) {
    payload.set("message_number", ++messages_);
    reporter_.send(id_, category, type, std::move(payload), at.wall);
}

} // namespace tamblo::pipewire
