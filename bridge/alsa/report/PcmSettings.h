#pragma once

#include "base/Dictionary.h"
#include "bridge/alsa/kernel/Mixer.h"
#include "bridge/alsa/kernel/Pcm.h"

#include <optional>
#include <set>
#include <string>

namespace tamblo::alsa {

/// What there is to say of a PCM, with the keys that summaries are derived from (`docs/messages.md`) and more
/// of this program's own (`docs/alsa.md`).
[[nodiscard]] Dictionary settingsOfPcm(const std::set<std::string>& devices,
                                       const std::optional<PcmFormat>& format,
                                       const std::optional<MixerVolume>& volume, bool isInput);

} // namespace tamblo::alsa
