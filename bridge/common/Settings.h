#pragma once

#include "base/Dictionary.h"

#include <cstdint>
#include <set>
#include <string>
#include <string_view>

namespace tamblo::bridge {

/// What there is to say of a stream at a moment.
struct StreamSettings {
    bool isRunning = false;
    /// Everything else, with the keys that summaries are derived from (`docs/messages.md`) and more of the
    /// program's own (`docs/pipewire.md`, `docs/alsa.md`).
    Dictionary settings;
};

/// The volume that people see for a factor of the signal: its cube root, from 0 to 1.
[[nodiscard]] double perceivedVolume(double linear) noexcept;

/// Six digits are more than anybody sees of a volume; the rest is noise of the arithmetic.
[[nodiscard]] double rounded(double value) noexcept;

/// Adds a text to a list with commas between, unless it is empty or the list would get too long.
void addToList(std::string& list, std::string_view text);
[[nodiscard]] std::string joined(const std::set<std::string>& texts);

[[nodiscard]] std::string upperCase(std::string_view text);

/// The settings that say a stream's format.
void setFormat(Dictionary& settings, const std::string& codec, std::uint32_t rate, std::uint32_t channels);

/// The entries of `now` that `before` has not, or has with another value.
[[nodiscard]] Dictionary changesBetween(const Dictionary& before, const Dictionary& now);

} // namespace tamblo::bridge
