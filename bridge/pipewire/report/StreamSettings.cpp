#include "bridge/pipewire/report/StreamSettings.h"
#include "bridge/pipewire/graph/Namespace.h"

#include "bridge/common/CleanText.h"
#include "bridge/pipewire/graph/Routes.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::pipewire {

namespace {

/// "1024/48000", in seconds.
void setLatency(Dictionary& settings, std::string_view latency) {
    const std::size_t slash = latency.find('/');
    std::uint32_t frames = 0;
    std::uint32_t rate = 0;
    if (slash == std::string_view::npos) {
        return;
    }
    std::from_chars(latency.data(), latency.data() + slash, frames);
    std::from_chars(latency.data() + slash + 1, latency.data() + latency.size(), rate);
    if (frames != 0 && rate != 0) {
        settings.set("requested_latency", rounded(static_cast<double>(frames) / rate));
    }
}

/// Filters say what they do by their names alone.
bool isSpatial(std::string_view name) {
    const std::string upper = upperCase(name);
    constexpr std::array<std::string_view, 4> words{"SPATIAL", "SURROUND", "BINAURAL", "HRTF"};
    return std::any_of(words.begin(), words.end(),
                       [&upper](std::string_view word) { return upper.find(word) != std::string::npos; });
}

/// What the devices that a stream reaches have in common, or each of them has.
class DeviceSettings {
public:
    void add(const DeviceFacts& facts) {
        names_.insert(facts.name);
        portTypes_.insert(facts.portType);
        formFactors_.insert(facts.formFactor);
        profiles_.insert(facts.bluetoothProfile);
        codecs_.insert(facts.bluetoothCodec);
        rate_ = rate_ == 0 ? facts.rate : rate_;
        volume_ = isFirst_ ? audible(facts.volume) : std::max(volume_, audible(facts.volume));
        isFirst_ = false;
    }

    [[nodiscard]] static double audible(const Volume& volume) noexcept {
        return volume.isMuted ? 0 : volume.linear;
    }
    /// The loudest's.
    [[nodiscard]] double volume() const noexcept { return volume_; }
    [[nodiscard]] std::uint32_t rate() const noexcept { return rate_; }
    [[nodiscard]] std::string names() const {
        const std::string list = joined(names_);
        return list.empty() ? "None" : list;
    }
    [[nodiscard]] std::string codecs() const { return joined(codecs_); }

    void setOthers(Dictionary& settings) const {
        settings.set("port_type", joined(portTypes_));
        settings.set("form_factor", joined(formFactors_));
        settings.set("bluetooth_profile", joined(profiles_));
        settings.set("bluetooth_codec", joined(codecs_));
    }

private:
    std::set<std::string> names_;
    std::set<std::string> portTypes_;
    std::set<std::string> formFactors_;
    std::set<std::string> profiles_;
    std::set<std::string> codecs_;
    std::uint32_t rate_ = 0;
    double volume_ = 1;
    bool isFirst_ = true;
};

/// What lies between a stream and the devices.
class FilterSettings {
public:
    FilterSettings(const Graph& graph, const std::vector<ObjectID>& filters) {
        for (const ObjectID id : filters) {
            const Node& filter = *graph.node(id);
            hasSpatial_ = hasSpatial_ || isSpatial(filter.name) || isSpatial(filter.description);
            volume_ *= DeviceSettings::audible(filter.volume.value_or(Volume{}));
            addToList(names_, filterName(filter));
        }
    }

    [[nodiscard]] const std::string& names() const noexcept { return names_; }
    [[nodiscard]] bool hasSpatial() const noexcept { return hasSpatial_; }
    [[nodiscard]] double volume() const noexcept { return volume_; }

private:
    std::string names_;
    bool hasSpatial_ = false;
    double volume_ = 1;
};

void setVolume(Dictionary& settings, const Volume& stream, double device) {
    const double linear = DeviceSettings::audible(stream) * device;
    settings.set("QVSessionVolume", rounded(perceivedVolume(linear)));
    settings.set("linear_volume", rounded(linear));
    settings.set("stream_volume", rounded(perceivedVolume(stream.linear)));
    settings.set("stream_muted", stream.isMuted);
    settings.set("device_volume", rounded(perceivedVolume(device)));
}

/// What carries voice over a headset's link, by the name that reports have for it.
std::pair<std::string_view, std::string_view> vocoderOf(std::string_view codec) noexcept {
    if (codec == "msbc") {
        return {"mSBC", "16000"};
    }
    if (codec == "lc3_swb") {
        return {"LC3-SWB", "32000"};
    }
    return codec == "cvsd" ? std::pair<std::string_view, std::string_view>{"CVSD", "8000"}
                           : std::pair<std::string_view, std::string_view>{"none", "0.0"};
}

void setInput(Dictionary& settings, const DeviceSettings& devices, const std::string& filters) {
    const auto [vocoder, rate] = vocoderOf(devices.codecs());
    settings.set("vp_config_operation_mode", filters.empty() ? "none" : filters);
    settings.set("vp_config_input_port", devices.names());
    settings.set("vp_config_primary_vocoder", vocoder);
    settings.set("vp_config_primary_vocoderFs", rate);
}

} // namespace

StreamSettings settingsOf(const Graph& graph, ObjectID stream) {
    StreamSettings now;
    const Node* const node = graph.node(stream);
    if (node == nullptr) {
        return now;
    }
    const bool isInput = node->mediaClass == MediaClass::captureStream;
    const Reached reached = devicesReachedFrom(graph, stream);
    now.isRunning = node->state == NodeState::running && reached.isLinked;

    DeviceSettings devices;
    for (const ObjectID id : reached.devices) {
        const Node* const device = graph.node(id);
        devices.add(factsOf(graph, id, isInput && device->mediaClass == MediaClass::sink));
    }
    const FilterSettings filters(graph, reached.filters);

    Dictionary& settings = now.settings;
    settings.set("active_devices", devices.names());
    devices.setOthers(settings);
    settings.set("filters", filters.names());
    settings.set("spatializationEnabled", filters.hasSpatial());
    if (node->format) {
        setFormat(settings, node->format->codec, node->format->rate, node->format->channels);
        settings.set("is_resampled", devices.rate() != 0 && devices.rate() != node->format->rate);
    }
    if (devices.rate() != 0) {
        settings.set("device_sample_rate", devices.rate());
    }
    setVolume(settings, node->volume.value_or(Volume{}), filters.volume() * devices.volume());
    setLatency(settings, node->latency);
    const std::uint32_t quantum = node->quantum != 0 ? node->quantum : graph.server().quantumInForce();
    if (quantum != 0) {
        settings.set("io_buffer_size", quantum);
    }
    if (isInput) {
        setInput(settings, devices, filters.names());
    }
    return now;
}

} // namespace tamblo::pipewire
