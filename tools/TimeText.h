#pragma once

#include <optional>
#include <string_view>

namespace tamblo::tools {

/// The present, in seconds since 1970.
[[nodiscard]] double presentTime();

/// A moment as people type it, in seconds since 1970; nothing for what is none:
///
///   2026-03-01              the beginning of the day in UTC
///   2026-03-01T12:00        also with seconds and fractions, and with a space for the T; UTC, unless Z,
///                           +02:00 or the like stands behind it
///   90s, 5m, 2h, 3d         so long before now
///   1772366400.25           seconds since 1970
[[nodiscard]] std::optional<double> parseMoment(std::string_view text, double now);

} // namespace tamblo::tools
