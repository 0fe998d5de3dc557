#include "base/Format.h"

#include <charconv>

namespace tamblo {

namespace {

template <typename Integer> void appendInteger(std::string& out, Integer number) {
    char digits[24];
    const auto result = std::to_chars(digits, digits + sizeof digits, number);
    out.append(digits, result.ptr);
}

} // namespace

void appendText(std::string& out, std::string_view text) {
    out += text;
}

void appendText(std::string& out, std::int64_t number) {
    appendInteger(out, number);
}

void appendText(std::string& out, std::uint64_t number) {
    appendInteger(out, number);
}

void appendText(std::string& out, FixedPoint number) {
    // The longest double has 309 digits before the point; with a sign, the point and up to 64 digits it fits.
    char digits[384];
    const int precision = number.digits < 0 ? 0 : number.digits > 64 ? 64 : number.digits;
    const auto result =
        std::to_chars(digits, digits + sizeof digits, number.value, std::chars_format::fixed, precision);
    out.append(digits, result.ptr);
}

void appendText(std::string& out, Hexadecimal number) {
    for (unsigned digit = number.digits; digit-- > 0;) {
        out += "0123456789abcdef"[number.value >> 4U * digit & 0xFU];
    }
}

namespace format_detail {

void appendUpToPlaceholder(std::string& out, std::string_view& format) {
    const std::size_t placeholder = format.find("{}");
    out += format.substr(0, placeholder);
    format.remove_prefix(placeholder == std::string_view::npos ? format.size() : placeholder + 2);
}

} // namespace format_detail

} // namespace tamblo
