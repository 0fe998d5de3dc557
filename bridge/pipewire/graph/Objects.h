#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

/// What the sound server's world consists of, as far as reports need it. Texts have been cut and cleaned when
/// they stand here, and nothing else enters: `graph/Properties.h` has the list of what may.
namespace tamblo::pipewire {

/// The server's number of an object; given to another one when the object is gone.
using ObjectID = std::uint32_t;
inline constexpr ObjectID kNoObject = 0xFFFFFFFF;

/// Tells which node a name is meant for: cleaned, those of two headsets, which have their addresses, are
/// alike.
using NameHash = std::size_t;
inline constexpr NameHash kNoName = 0;
[[nodiscard]] inline NameHash hashOf(std::string_view name) noexcept {
    return name.empty() ? kNoName : std::hash<std::string_view>{}(name);
}

/// What an application calls itself. Streams may say it, or the client that they belong to.
struct ApplicationNames {
    std::string portal;     ///< the identifier that a sandbox vouches for
    std::string identifier; ///< such as "org.example.Player"
    std::string binary;     ///< of the process
    std::string name;

    bool operator==(const ApplicationNames&) const = default;
};

struct Client {
    ApplicationNames application;

    bool operator==(const Client&) const = default;
};

enum class MediaClass : std::uint8_t {
    other,          ///< filters between others, and what carries no sound
    playbackStream, ///< an application plays
    captureStream,  ///< an application records
    sink,
    source,
    duplex,
};

enum class NodeState : std::uint8_t { creating, suspended, idle, running, error };

struct Format {
    std::string codec; ///< "lpcm", or how the stream is compressed; empty: not known
    std::uint32_t rate = 0;
    std::uint32_t channels = 0;

    bool operator==(const Format&) const = default;
};

struct Volume {
    double linear = 1; ///< the factor of the loudest channel
    bool isMuted = false;

    bool operator==(const Volume&) const = default;
};

struct Node {
    MediaClass mediaClass = MediaClass::other;
    /// Whether the server has told more than that it is there.
    bool isKnown = false;
    NodeState state = NodeState::creating;
    /// How often it has come to be in an error, and what the last one was called.
    std::uint32_t errors = 0;
    std::string error;

    ObjectID client = kNoObject;
    ObjectID device = kNoObject;
    /// Which of the device's ends it is, as the device's routes count them.
    std::optional<std::uint32_t> endOfDevice;

    std::string name;
    NameHash nameHash = kNoName; ///< of the name as it was
    std::string description;
    std::string nick;
    std::string role;
    std::string latency; ///< frames and rate that it asks for, "1024/48000"
    /// What nodes have in common that are the two sides of one filter.
    std::string linkGroup;
    std::string bluetoothProfile;
    std::string bluetoothCodec;
    std::string formFactor;
    ApplicationNames application;
    bool isVirtual = false; ///< no device, but a place that others connect to
    bool isMonitor = false; ///< it only shows levels

    [[nodiscard]] bool isStream() const noexcept {
        return mediaClass == MediaClass::playbackStream || mediaClass == MediaClass::captureStream;
    }
    /// An application's stream of which enough is known to report it: no side of a filter, and no level
    /// meter.
    [[nodiscard]] bool isReported() const noexcept {
        return isStream() && isKnown && linkGroup.empty() && !isMonitor;
    }
    /// A sink, a source, or both.
    [[nodiscard]] bool isDevice() const noexcept { return !isStream() && mediaClass != MediaClass::other; }

    std::optional<Format> format;
    std::optional<Volume> volume;
    std::uint32_t quantum = 0; ///< frames that it last handled at a time; 0: not known

    bool operator==(const Node&) const = default;
};

/// A connector of a device, and what is behind it: headphones, a speaker.
struct Route {
    bool isOutput = true;
    std::uint32_t end = 0; ///< the node's `endOfDevice`
    std::string description;
    std::string portType;

    bool operator==(const Route&) const = default;
};

struct Device {
    bool isKnown = false;
    std::string description;
    std::string nick;
    std::string api; ///< "alsa", "bluez5"
    std::string bus;
    std::string formFactor;
    std::string vendor; ///< numbers of the maker and of the product, not of the piece
    std::string product;
    /// Tells a wireless one from others on this machine; a hash, of which its address cannot be had.
    std::string identifier;
    std::string profile;
    std::string profileDescription;
    std::vector<Route> routes; ///< the active ones

    bool operator==(const Device&) const = default;
};

struct Link {
    ObjectID output = kNoObject; ///< the node that gives
    ObjectID input = kNoObject;  ///< the node that takes

    bool operator==(const Link&) const = default;
};

/// What the server says of itself, and what a session manager has set for all.
struct Server {
    std::string version;
    NameHash defaultSink = kNoName;
    NameHash defaultSource = kNoName;
    std::uint32_t rate = 0;    ///< Hz; 0: not known
    std::uint32_t quantum = 0; ///< frames
    /// What somebody has set instead, for as long as it is set; 0: nothing.
    std::uint32_t forcedRate = 0;
    std::uint32_t forcedQuantum = 0;

    [[nodiscard]] std::uint32_t rateInForce() const noexcept { return forcedRate != 0 ? forcedRate : rate; }
    [[nodiscard]] std::uint32_t quantumInForce() const noexcept {
        return forcedQuantum != 0 ? forcedQuantum : quantum;
    }

    bool operator==(const Server&) const = default;
};

} // namespace tamblo::pipewire
