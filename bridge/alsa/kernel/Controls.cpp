#include "bridge/alsa/kernel/Controls.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <numeric>

#include <sound/tlv.h>

namespace tamblo::alsa {

namespace {

/// Each lies on every way to the card's outputs.
constexpr std::array<std::string_view, 2> kOutputs{"Master Playback", "PCM Playback"};
/// What stands for the card where it has neither.
constexpr std::array<std::string_view, 5> kOtherOutputs{
    "Speaker Playback", "Headphone Playback", "Digital Playback", "Line Out Playback", "DAC Playback"};
constexpr std::array<std::string_view, 5> kInputs{"Capture", "Mic Capture", "Headset Capture",
                                                  "Digital Capture", "ADC Capture"};
constexpr std::string_view kVolume = " Volume";
constexpr std::string_view kSwitch = " Switch";

/// In hundredths of a decibel, as the drivers count. That low is silence.
constexpr double kSilence = SNDRV_CTL_TLVD_DB_GAIN_MUTE;
/// No amplifier of a sound card has more.
constexpr double kMostGain = 10'000;

double factorOf(double hundredths) noexcept {
    constexpr double perDecade = 2000;
    return hundredths <= kSilence ? 0 : std::pow(10, std::min(hundredths, kMostGain) / perDecade);
}

/// How far a value lies in a range, from 0 to 1.
double shareOf(std::int64_t value, std::int64_t minimum, std::int64_t maximum) noexcept {
    const auto range = static_cast<double>(maximum) - static_cast<double>(minimum);
    const double above = static_cast<double>(value) - static_cast<double>(minimum);
    return range > 0 ? std::clamp(above / range, 0.0, 1.0) : 1;
}

/// The kernel's numbers are signed.
double signedNumber(std::uint32_t word) noexcept {
    return static_cast<std::int32_t>(word);
}

struct Range {
    std::int64_t minimum;
    std::int64_t maximum;
};

/// By one block, which may hold others, at most so many one in another; nothing for one that says nothing of
/// decibels.
std::optional<double> factorBy(std::span<const std::uint32_t> words, std::int64_t value, Range range,
                               int depth = 4) {
    constexpr std::size_t header = 2;
    if (words.size() < header || depth == 0) {
        return std::nullopt;
    }
    const std::uint32_t type = words[0];
    const std::size_t length = words[1] / sizeof(std::uint32_t);
    const auto content = words.subspan(header, std::min(length, words.size() - header));
    if (type == SNDRV_CTL_TLVT_CONTAINER) {
        for (auto rest = content; rest.size() >= header;) {
            if (const auto factor = factorBy(rest, value, range, depth - 1)) {
                return factor;
            }
            rest = rest.subspan(std::min(header + rest[1] / sizeof(std::uint32_t), rest.size()));
        }
        return std::nullopt;
    }
    if (type == SNDRV_CTL_TLVT_DB_RANGE) {
        for (auto rest = content; rest.size() >= header + header;) {
            const Range part{static_cast<std::int32_t>(rest[0]), static_cast<std::int32_t>(rest[1])};
            const auto inner = rest.subspan(header);
            const std::size_t size = header + inner[1] / sizeof(std::uint32_t);
            rest = inner.subspan(std::min(size, inner.size()));
            if (value <= part.maximum || rest.size() < header + header) {
                return factorBy(inner, std::clamp(value, std::min(part.minimum, part.maximum), part.maximum),
                                part, depth - 1);
            }
        }
        return std::nullopt;
    }
    if (content.size() < 2) {
        return std::nullopt;
    }
    const double low = signedNumber(content[0]);
    const double high = signedNumber(content[1]);
    const double share = shareOf(value, range.minimum, range.maximum);
    const bool isLowest = value <= range.minimum;
    switch (type) {
    case SNDRV_CTL_TLVT_DB_SCALE: {
        const double steps = static_cast<double>(value) - static_cast<double>(range.minimum);
        const double step = content[1] & SNDRV_CTL_TLVD_DB_SCALE_MASK;
        const bool isMute = isLowest && (content[1] & SNDRV_CTL_TLVD_DB_SCALE_MUTE) != 0;
        return isMute ? 0 : factorOf(low + steps * step);
    }
    case SNDRV_CTL_TLVT_DB_LINEAR:
        return std::lerp(factorOf(low), factorOf(high), share);
    case SNDRV_CTL_TLVT_DB_MINMAX_MUTE:
    case SNDRV_CTL_TLVT_DB_MINMAX:
        return type == SNDRV_CTL_TLVT_DB_MINMAX_MUTE && isLowest ? 0 : factorOf(std::lerp(low, high, share));
    default:
        return std::nullopt;
    }
}

const Control* find(std::span<const Control> controls, std::string_view base, std::string_view kind) {
    const auto found = std::ranges::find_if(controls, [&](const Control& control) {
        return control.name.size() == base.size() + kind.size() && control.name.starts_with(base) &&
               control.name.ends_with(kind) && !control.values.empty();
    });
    return found == controls.end() ? nullptr : &*found;
}

/// Takes a volume and a switch of this name, or what there is of them, into account.
void apply(std::span<const Control> controls, std::string_view base, std::optional<MixerVolume>& volume) {
    if (const Control* const level = find(controls, base, kVolume)) {
        const double factor = std::accumulate(level->values.begin(), level->values.end(), 0.0,
                                              [level](double loudest, std::int64_t value) {
                                                  return std::max(loudest, linearFactor(*level, value));
                                              });
        volume = volume.value_or(MixerVolume{});
        volume->linear *= factor;
    }
    if (const Control* const control = find(controls, base, kSwitch)) {
        const bool isOff = std::ranges::all_of(control->values, [](std::int64_t on) { return on == 0; });
        volume = volume.value_or(MixerVolume{});
        volume->isMuted = volume->isMuted || isOff;
    }
}

bool isNameOf(std::string_view name, std::span<const std::string_view> bases) noexcept {
    return std::ranges::any_of(bases, [name](std::string_view base) {
        return name.starts_with(base) &&
               (name.substr(base.size()) == kVolume || name.substr(base.size()) == kSwitch);
    });
}

} // namespace

bool concernsVolume(std::string_view name) noexcept {
    return isNameOf(name, kOutputs) || isNameOf(name, kOtherOutputs) || isNameOf(name, kInputs);
}

double linearFactor(const Control& control, std::int64_t value) {
    if (const auto factor = factorBy(control.decibels, value, {control.minimum, control.maximum})) {
        return *factor;
    }
    return std::pow(shareOf(value, control.minimum, control.maximum), 3);
}

std::optional<MixerVolume> volumeOf(std::span<const Control> controls, bool isInput) {
    std::optional<MixerVolume> volume;
    if (!isInput) {
        for (const std::string_view base : kOutputs) {
            apply(controls, base, volume);
        }
    }
    for (const std::string_view base : isInput ? kInputs : kOtherOutputs) {
        if (!volume) {
            apply(controls, base, volume);
        }
    }
    return volume;
}

} // namespace tamblo::alsa
