#pragma once

#include <string_view>

namespace tamblo {

/// Whether the bytes are well-formed UTF-8 (RFC 3629): no overlong forms, no surrogates, nothing above
/// U+10FFFF.
[[nodiscard]] bool isUtf8(std::string_view text) noexcept;

/// Whether the byte goes on with a character that an earlier byte began.
[[nodiscard]] constexpr bool isUtf8Continuation(char byte) noexcept {
    return (static_cast<unsigned char>(byte) & 0xC0U) == 0x80U;
}

} // namespace tamblo
