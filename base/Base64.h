#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// Standard Base64 with padding, on one line (RFC 4648, section 4).
[[nodiscard]] std::string encodeBase64(std::span<const std::uint8_t> bytes);
/// The bytes of such a text, or nothing when it is not one.
[[nodiscard]] std::optional<std::vector<std::uint8_t>> decodeBase64(std::string_view text);

} // namespace tamblo
