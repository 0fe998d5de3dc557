#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace tamblo::bridge {

/// Bytes of a text in a report at most.
inline constexpr std::size_t kMostTextBytes = 128;

/// A text of others as reports may have it: well-formed UTF-8 without control characters, cut, and
/// with "?" for what was not readable. Addresses of devices, six pairs of hexadecimal digits with a ":", "_"
/// or "-" between, are taken out wherever they stand: a headset without a name is called by its address. So
/// are words that name a user of a machine (USER@HOST) or an internet address.
[[nodiscard]] std::string cleanText(std::string_view text, std::size_t mostBytes = kMostTextBytes);

} // namespace tamblo::bridge
