#pragma once

#include <cstddef>
#include <string_view>

namespace tamblo {

/// Whether the bytes are well-formed UTF-8 (RFC 3629): no overlong forms, no surrogates, nothing above
/// U+10FFFF.
[[nodiscard]] bool isUtf8(std::string_view text) noexcept;

/// Whether the byte goes on with a character that an earlier byte began.
[[nodiscard]] constexpr bool isUtf8Continuation(char byte) noexcept {
    return (static_cast<unsigned char>(byte) & 0xC0U) == 0x80U;
}

/// The text, of one longer than so many bytes the characters that fit into these.
[[nodiscard]] constexpr std::string_view cutUtf8(std::string_view text, std::size_t longest) noexcept {
    if (text.size() > longest) {
        while (longest > 0 && isUtf8Continuation(text[longest])) {
            --longest;
        }
    }
    return text.substr(0, longest);
}

/// How many bytes from an index of the text on are a control character, of ASCII or of the second set that
/// terminals obey (U+0080 to U+009F); 0 where there is none.
[[nodiscard]] constexpr std::size_t controlLength(std::string_view text, std::size_t at) noexcept {
    const auto byte = static_cast<unsigned char>(text[at]);
    if (byte < 0x20 || byte == 0x7F) {
        return 1;
    }
    const auto second = static_cast<unsigned char>(byte == 0xC2 && at + 1 < text.size() ? text[at + 1] : 0);
    return second >= 0x80 && second <= 0x9F ? 2 : 0;
}

} // namespace tamblo
