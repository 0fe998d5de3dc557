#pragma once

#include <charconv>
#include <concepts>
#include <optional>
#include <string_view>

namespace tamblo {

/// The number that the whole text is, an integer perhaps in digits of a base other than ten; nothing when it
/// is anything else or does not fit.
template <typename Number>
[[nodiscard]] std::optional<Number> parseNumber(std::string_view text,
                                                std::same_as<int> auto... base) noexcept {
    Number number{};
    const char* const behind = text.data() + text.size();
    const auto [end, error] = std::from_chars(text.data(), behind, number, base...);
    return error == std::errc() && end == behind ? std::optional(number) : std::nullopt;
}

/// The same, decimal or with 0x.
template <typename Number>
[[nodiscard]] std::optional<Number> parseDecimalOrHex(std::string_view text) noexcept {
    const bool isHexadecimal = text.starts_with("0x") || text.starts_with("0X");
    return isHexadecimal ? parseNumber<Number>(text.substr(2), 16) : parseNumber<Number>(text);
}

/// The number that is nearest to a decimal text, which begins with a digit or a point and is read as far as
/// it goes: infinity for one too large for a double, 0 for one too small.
[[nodiscard]] double nearestDouble(std::string_view decimal) noexcept;

} // namespace tamblo
