#include "bridge/alsa/report/PcmSettings.h"

#include "bridge/common/Settings.h"

#include <algorithm>
#include <array>
#include <string_view>

namespace tamblo::alsa {

namespace {

/// Samples of sound have a width, such as "S16_LE" and "FLOAT_LE"; what is coded is called after its code.
std::string codecOf(std::string_view sample) {
    constexpr std::array<std::string_view, 6> codes{"IEC958", "MU_LAW", "A_LAW", "IMA_ADPCM", "MPEG", "GSM"};
    const auto code =
        std::ranges::find_if(codes, [sample](std::string_view name) { return sample.starts_with(name); });
    std::string codec(code == codes.end() ? "LPCM" : *code);
    std::ranges::transform(codec, codec.begin(), [](char byte) {
        return byte >= 'A' && byte <= 'Z' ? static_cast<char>(byte - 'A' + 'a') : byte;
    });
    return codec;
}

} // namespace

Dictionary settingsOfPcm(const std::set<std::string>& devices, const std::optional<PcmFormat>& format,
                         const std::optional<MixerVolume>& volume, bool isInput) {
    Dictionary settings;
    const std::string list = bridge::joined(devices);
    settings.set("active_devices", list);
    if (isInput) {
        settings.set("vp_config_input_port", list);
        settings.set("vp_config_operation_mode", "none");
    }
    if (format) {
        bridge::setFormat(settings, codecOf(format->sample), format->rate, format->channels);
        settings.set("sample_format", format->sample);
        settings.set("device_sample_rate", format->rate);
        settings.set("io_buffer_size", format->periodFrames);
        settings.set("device_buffer_size", format->bufferFrames);
        settings.set("requested_latency",
                     bridge::rounded(static_cast<double>(format->bufferFrames) / format->rate));
    }
    if (volume) {
        const double linear = volume->isMuted ? 0 : volume->linear;
        settings.set("QVSessionVolume", bridge::rounded(bridge::perceivedVolume(linear)));
        settings.set("linear_volume", bridge::rounded(linear));
        settings.set("device_volume", bridge::rounded(bridge::perceivedVolume(volume->linear)));
    }
    return settings;
}

} // namespace tamblo::alsa
