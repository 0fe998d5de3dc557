#pragma once

#include "bridge/alsa/kernel/Mixer.h"

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::alsa {

/// A control of a card's mixer, as the kernel has it.
struct Control {
    std::string name; ///< "Master Playback Volume"
    std::int64_t minimum = 0;
    std::int64_t maximum = 1;
    std::vector<std::int64_t> values{}; ///< of each channel
    /// What the driver says of its decibels, in the kernel's blocks of type, length and content; may be
    /// empty.
    std::vector<std::uint32_t> decibels{};
};

/// Whether a control of this name has a part in a volume at all.
[[nodiscard]] bool concernsVolume(std::string_view name) noexcept;

/// The factor that a value of a control stands for: by the driver's decibels or, without any, so that people
/// see its share of the range as the volume.
[[nodiscard]] double linearFactor(const Control& control, std::int64_t value);

/// Of a card with these controls: those that are called "Master" and "PCM", one after the other, or else the
/// first of some that stand for the whole card where there are no such ones; of recording, "Capture" or else
/// another. Nothing without any.
[[nodiscard]] std::optional<MixerVolume> volumeOf(std::span<const Control> controls, bool isInput);

} // namespace tamblo::alsa
