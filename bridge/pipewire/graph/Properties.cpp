#include "bridge/pipewire/graph/Properties.h"
#include "bridge/pipewire/graph/Namespace.h"

#include "base/Json.h"
#include "bridge/common/CleanText.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <optional>
#include <span>
#include <utility>

namespace tamblo::pipewire {

namespace {

std::optional<std::uint32_t> numberOf(std::string_view text) noexcept {
    std::uint32_t number = 0;
    const auto read = std::from_chars(text.data(), text.data() + text.size(), number);
    return read.ec == std::errc() && read.ptr == text.data() + text.size() && !text.empty()
               ? std::optional(number)
               : std::nullopt;
}

/// Of a metadata value that is JSON; a longer one is read as far as that, so not at all.
constexpr std::size_t kMostMetadataBytes = 4096;

ObjectID objectOf(std::string_view text) noexcept {
    return numberOf(text).value_or(kNoObject);
}

bool isTrue(std::string_view text) noexcept {
    return text == "true" || text == "1";
}

template <typename Object> using Field = std::pair<std::string_view, std::string Object::*>;

/// Whether the key is one of a text.
template <typename Object>
bool takeText(Object& object, std::span<const Field<Object>> fields, std::string_view key,
              std::string_view value) {
    const auto field =
        std::find_if(fields.begin(), fields.end(), [key](const auto& known) { return known.first == key; });
    if (field == fields.end()) {
        return false;
    }
    object.*field->second = cleanText(value);
    return true;
}

constexpr std::array<Field<ApplicationNames>, 4> kApplicationFields{{
    {"pipewire.access.portal.app_id", &ApplicationNames::portal},
    {"application.id", &ApplicationNames::identifier},
    {"application.process.binary", &ApplicationNames::binary},
    {"application.name", &ApplicationNames::name},
}};

constexpr std::array<Field<Device>, 7> kDeviceFields{{
    {"device.description", &Device::description},
    {"device.nick", &Device::nick},
    {"device.api", &Device::api},
    {"device.bus", &Device::bus},
    {"device.form-factor", &Device::formFactor},
    {"device.vendor.id", &Device::vendor},
    {"device.product.id", &Device::product},
}};

/// Of a stream, neither `node.description` nor `node.nick` nor `media.name` is taken: they carry titles.
constexpr std::array<Field<Node>, 6> kNodeFields{{
    {"media.role", &Node::role},
    {"node.latency", &Node::latency},
    {"node.link-group", &Node::linkGroup},
    {"api.bluez5.profile", &Node::bluetoothProfile},
    {"api.bluez5.codec", &Node::bluetoothCodec},
    {"device.form-factor", &Node::formFactor},
}};

constexpr std::array<Field<Node>, 2> kNodeNameFields{{
    {"node.description", &Node::description},
    {"node.nick", &Node::nick},
}};

constexpr std::array<Field<Route>, 1> kRouteFields{{{"port.type", &Route::portType}}};

MediaClass mediaClassOf(std::string_view text) noexcept {
    constexpr std::array<std::pair<std::string_view, MediaClass>, 8> classes{{
        {"Stream/Output/Audio", MediaClass::playbackStream},
        {"Stream/Input/Audio", MediaClass::captureStream},
        {"Audio/Sink", MediaClass::sink},
        {"Audio/Source", MediaClass::source},
        {"Audio/Source/Virtual", MediaClass::source},
        // Devices that later servers show to applications through a filter alone, such as headsets.
        {"Audio/Sink/Internal", MediaClass::sink},
        {"Audio/Source/Internal", MediaClass::source},
        {"Audio/Duplex", MediaClass::duplex},
    }};
    for (const auto& [name, mediaClass] : classes) {
        if (name == text) {
            return mediaClass;
        }
    }
    return MediaClass::other;
}

} // namespace

void takeProperty(Client& client, std::string_view key, std::string_view value) {
    takeText<ApplicationNames>(client.application, kApplicationFields, key, value);
}

void takeProperty(Device& device, std::string_view key, std::string_view value) {
    takeText<Device>(device, kDeviceFields, key, value);
}

void takeProperty(Node& node, std::string_view key, std::string_view value) {
    if (key == "media.class") {
        node.mediaClass = mediaClassOf(value);
        node.isVirtual = node.isVirtual || value == "Audio/Source/Virtual";
        if (node.isStream()) {
            node.description.clear();
            node.nick.clear();
        }
    } else if (key == "node.name") {
        node.name = cleanText(value);
        node.nameHash = hashOf(value);
    } else if (key == "client.id") {
        node.client = objectOf(value);
    } else if (key == "device.id") {
        node.device = objectOf(value);
    } else if (key == "card.profile.device") {
        node.endOfDevice = numberOf(value);
    } else if (key == "node.virtual" || key == "factory.name") {
        node.isVirtual = node.isVirtual || isTrue(value) || value == "support.null-audio-sink";
    } else if (key == "stream.monitor" || key == "resample.peaks") {
        node.isMonitor = node.isMonitor || isTrue(value);
    } else if (!takeText<Node>(node, kNodeFields, key, value) &&
               (node.isStream() || !takeText<Node>(node, kNodeNameFields, key, value))) {
        takeText<ApplicationNames>(node.application, kApplicationFields, key, value);
    }
}

void takeProperty(Link& link, std::string_view key, std::string_view value) {
    if (key == "link.output.node") {
        link.output = objectOf(value);
    } else if (key == "link.input.node") {
        link.input = objectOf(value);
    }
}

void takeProperty(Route& route, std::string_view key, std::string_view value) {
    takeText<Route>(route, kRouteFields, key, value);
}

void takeMetadata(Server& server, std::string_view key, std::string_view value) {
    const auto nameIn = [value] {
        const auto parsed = readJson(value.substr(0, kMostMetadataBytes));
        const auto* const object = std::get_if<Value>(&parsed);
        const Value* const name = object == nullptr ? nullptr : object->dictionaryValue().find("name");
        return name == nullptr ? kNoName : hashOf(name->stringValue());
    };
    if (key == "default.audio.sink") {
        server.defaultSink = nameIn();
    } else if (key == "default.audio.source") {
        server.defaultSource = nameIn();
    } else if (key == "clock.rate") {
        server.rate = numberOf(value).value_or(0);
    } else if (key == "clock.quantum") {
        server.quantum = numberOf(value).value_or(0);
    } else if (key == "clock.force-rate") {
        server.forcedRate = numberOf(value).value_or(0);
    } else if (key == "clock.force-quantum") {
        server.forcedQuantum = numberOf(value).value_or(0);
    }
}

} // namespace tamblo::pipewire
