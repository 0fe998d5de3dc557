#pragma once

#include <string>
#include <string_view>

namespace tamblo {

/// SHA-256 (FIPS 180-4) of bytes, in 64 lower-case hexadecimal digits.
[[nodiscard]] std::string sha256(std::string_view bytes);

} // namespace tamblo
