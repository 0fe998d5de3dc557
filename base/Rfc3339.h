#pragma once

#include <optional>
#include <string>

namespace tamblo {

/// Seconds since 1970 as an RFC 3339 text in UTC with milliseconds, `2026-03-01T12:00:00.250Z`, rounded to
/// the nearest. Nothing for a time that has no such text: not finite, or outside the years 0 to 9999.
[[nodiscard]] std::optional<std::string> formatRfc3339(double secondsSince1970);

/// The day of that text, its full-date: `2026-03-01`. Such texts sort by time.
[[nodiscard]] std::optional<std::string> formatRfc3339Date(double secondsSince1970);

} // namespace tamblo
