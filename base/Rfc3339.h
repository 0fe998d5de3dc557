#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace tamblo {

/// Seconds since 1970 as an RFC 3339 text in UTC with milliseconds, `2026-03-01T12:00:00.250Z`, rounded to
/// the nearest. Nothing for a time that has no such text: not finite, or outside the years 0 to 9999.
[[nodiscard]] std::optional<std::string> formatRfc3339(double secondsSince1970);
/// Reads an RFC 3339 text with any offset and any number of fraction digits.
[[nodiscard]] std::optional<double> parseRfc3339(std::string_view text);

} // namespace tamblo
