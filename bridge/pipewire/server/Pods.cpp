#include "bridge/pipewire/server/Pods.h"
#include "bridge/pipewire/graph/Namespace.h"

#include "bridge/common/CleanText.h"
#include "bridge/pipewire/graph/Properties.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <string_view>
#include <utility>

#include <spa/param/audio/format-utils.h>
#include <spa/param/profile.h>
#include <spa/param/props.h>
#include <spa/param/route.h>
#include <spa/pod/iter.h>

namespace tamblo::pipewire {

namespace {

/// The louder ones are a mistake.
constexpr double kMostLinear = 1000;

const spa_pod* valueOf(const spa_pod* object, std::uint32_t key) noexcept {
    const spa_pod_prop* const property =
        spa_pod_is_object(object) ? spa_pod_find_prop(object, nullptr, key) : nullptr;
    return property == nullptr ? nullptr : &property->value;
}

/// The library does not look whether a text ends within its bytes.
std::optional<std::string_view> stringIn(const spa_pod* value) noexcept {
    if (value == nullptr || spa_pod_is_string(value) == 0) {
        return std::nullopt;
    }
    const std::string_view bytes(static_cast<const char*>(SPA_POD_BODY_CONST(value)),
                                 SPA_POD_BODY_SIZE(value));
    const std::size_t end = bytes.find('\0');
    return end == bytes.npos ? std::nullopt : std::optional(bytes.substr(0, end));
}

std::string textOf(const spa_pod* object, std::uint32_t key) {
    return cleanText(stringIn(valueOf(object, key)).value_or(""));
}

/// One that is a choice counts by its default, as the first of its values is.
std::uint32_t numberOf(const spa_pod* object, std::uint32_t key) noexcept {
    const spa_pod* value = valueOf(object, key);
    std::uint32_t count = 0;
    std::uint32_t kind = 0;
    if (value != nullptr && spa_pod_is_choice(value)) {
        value = spa_pod_get_values(value, &count, &kind);
        value = count == 0 ? nullptr : value;
    }
    std::int32_t number = 0;
    return value != nullptr && spa_pod_get_int(value, &number) == 0 ? static_cast<std::uint32_t>(number) : 0;
}

/// The loudest channel's factor; 1 without channels. The library copies values of whatever size they say that
/// they have.
double loudestOf(const spa_pod* channels) noexcept {
    std::array<float, SPA_AUDIO_MAX_CHANNELS> linear{};
    std::uint32_t count = 0;
    if (channels != nullptr && spa_pod_is_array(channels) != 0 &&
        SPA_POD_ARRAY_VALUE_SIZE(channels) == sizeof(float)) {
        count = spa_pod_copy_array(channels, SPA_TYPE_Float, linear.data(), SPA_AUDIO_MAX_CHANNELS);
    }
    return count == 0 ? 1.0 : static_cast<double>(*std::max_element(linear.begin(), linear.begin() + count));
}

std::string_view codecOf(std::uint32_t subtype) noexcept {
    constexpr std::array<std::pair<std::uint32_t, std::string_view>, 12> codecs{{
        {SPA_MEDIA_SUBTYPE_raw, "lpcm"},
        {SPA_MEDIA_SUBTYPE_dsp, "lpcm"},
        {SPA_MEDIA_SUBTYPE_iec958, "iec958"},
        {SPA_MEDIA_SUBTYPE_dsd, "dsd"},
        {SPA_MEDIA_SUBTYPE_mp3, "mp3"},
        {SPA_MEDIA_SUBTYPE_aac, "aac"},
        {SPA_MEDIA_SUBTYPE_vorbis, "vorbis"},
        {SPA_MEDIA_SUBTYPE_wma, "wma"},
        {SPA_MEDIA_SUBTYPE_sbc, "sbc"},
        {SPA_MEDIA_SUBTYPE_flac, "flac"},
        {SPA_MEDIA_SUBTYPE_ape, "ape"},
        {SPA_MEDIA_SUBTYPE_alac, "alac"},
    }};
    for (const auto& [number, name] : codecs) {
        if (number == subtype) {
            return name;
        }
    }
    return "unknown";
}

/// What is sent through as it is, for a receiver to decode.
std::string_view passedThrough(std::uint32_t codec) noexcept {
    switch (codec) {
    case SPA_AUDIO_IEC958_CODEC_PCM:
        return "lpcm";
    case SPA_AUDIO_IEC958_CODEC_DTS:
        return "dts";
    case SPA_AUDIO_IEC958_CODEC_AC3:
        return "ac-3";
    case SPA_AUDIO_IEC958_CODEC_MPEG:
        return "mpeg";
    case SPA_AUDIO_IEC958_CODEC_MPEG2_AAC:
        return "aac";
    case SPA_AUDIO_IEC958_CODEC_EAC3:
        return "ec-3";
    case SPA_AUDIO_IEC958_CODEC_TRUEHD:
        return "truehd";
    case SPA_AUDIO_IEC958_CODEC_DTSHD:
        return "dts-hd";
    default:
        return "iec958";
    }
}

} // namespace

std::optional<Format> formatOf(const spa_pod* parameter) {
    std::uint32_t type = 0;
    std::uint32_t subtype = 0;
    if (parameter == nullptr || !spa_pod_is_object(parameter) ||
        spa_format_parse(parameter, &type, &subtype) < 0 || type != SPA_MEDIA_TYPE_audio) {
        return std::nullopt;
    }
    Format format;
    format.codec = codecOf(subtype);
    if (subtype == SPA_MEDIA_SUBTYPE_iec958) {
        const spa_pod* const codec = valueOf(parameter, SPA_FORMAT_AUDIO_iec958Codec);
        std::uint32_t number = 0;
        if (codec != nullptr && spa_pod_get_id(codec, &number) == 0) {
            format.codec = passedThrough(number);
        }
    }
    format.rate = numberOf(parameter, SPA_FORMAT_AUDIO_rate);
    format.channels = numberOf(parameter, SPA_FORMAT_AUDIO_channels);
    return format;
}

std::optional<Volume> volumeOf(const spa_pod* parameter) {
    const spa_pod* const channels =
        parameter == nullptr ? nullptr : valueOf(parameter, SPA_PROP_channelVolumes);
    const spa_pod* const all = parameter == nullptr ? nullptr : valueOf(parameter, SPA_PROP_volume);
    const spa_pod* const mute = parameter == nullptr ? nullptr : valueOf(parameter, SPA_PROP_mute);
    if (channels == nullptr && all == nullptr && mute == nullptr) {
        return std::nullopt;
    }
    Volume volume;
    float factor = 1;
    if (all != nullptr) {
        (void)spa_pod_get_float(all, &factor);
    }
    const double product = loudestOf(channels) * static_cast<double>(factor);
    volume.linear = std::isfinite(product) ? std::clamp(product, 0.0, kMostLinear) : 0;
    bool isMuted = false;
    volume.isMuted = mute != nullptr && spa_pod_get_bool(mute, &isMuted) == 0 && isMuted;
    return volume;
}

std::optional<Route> routeOf(const spa_pod* parameter) {
    if (parameter == nullptr || !spa_pod_is_object(parameter)) {
        return std::nullopt;
    }
    const spa_pod* const direction = valueOf(parameter, SPA_PARAM_ROUTE_direction);
    std::uint32_t side = SPA_DIRECTION_OUTPUT;
    if (direction == nullptr || spa_pod_get_id(direction, &side) < 0) {
        return std::nullopt;
    }
    Route route;
    route.isOutput = side == SPA_DIRECTION_OUTPUT;
    route.end = numberOf(parameter, SPA_PARAM_ROUTE_device);
    route.description = textOf(parameter, SPA_PARAM_ROUTE_description);

    // A number, and then so many pairs of texts.
    const spa_pod* const information = valueOf(parameter, SPA_PARAM_ROUTE_info);
    if (information == nullptr || !spa_pod_is_struct(information)) {
        return route;
    }
    std::string_view key;
    bool isKey = true;
    const void* const body = SPA_POD_BODY_CONST(information);
    const std::uint32_t size = SPA_POD_BODY_SIZE(information);
    for (auto* item = static_cast<const spa_pod*>(body); spa_pod_is_inside(body, size, item);
         item = static_cast<const spa_pod*>(spa_pod_next(item))) {
        const auto text = stringIn(item);
        if (!text) {
            continue;
        }
        if (!isKey) {
            takeProperty(route, key, *text);
        }
        key = *text;
        isKey = !isKey;
    }
    return route;
}

std::optional<Profile> profileOf(const spa_pod* parameter) {
    if (parameter == nullptr || !spa_pod_is_object(parameter)) {
        return std::nullopt;
    }
    Profile profile;
    profile.name = textOf(parameter, SPA_PARAM_PROFILE_name);
    profile.description = textOf(parameter, SPA_PARAM_PROFILE_description);
    profile.isOff = profile.name == "off";
    return profile;
}

} // namespace tamblo::pipewire
