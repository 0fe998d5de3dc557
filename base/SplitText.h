#pragma once

#include <charconv>
#include <optional>
#include <string_view>
#include <system_error>

namespace tamblo {

/// Pieces of the small texts that kernel, daemons and administrators write.

/// Without the white space at both ends.
[[nodiscard]] std::string_view trimmed(std::string_view text) noexcept;

/// Takes the text up to the separator, or all of it, off the front, and the separator with it.
std::string_view takeUpTo(char separator, std::string_view& text) noexcept;

/// Takes a number off the front, if there is one that the type can hold.
template <typename Number> [[nodiscard]] std::optional<Number> takeNumber(std::string_view& text) noexcept {
    Number number{};
    const auto result = std::from_chars(text.data(), text.data() + text.size(), number);
    if (result.ec != std::errc()) {
        return std::nullopt;
    }
    text.remove_prefix(static_cast<std::size_t>(result.ptr - text.data()));
    return number;
}

/// What stands behind the colon of the first line "NAME : VALUE", without white space at both ends.
[[nodiscard]] std::optional<std::string_view> fieldOf(std::string_view text, std::string_view name) noexcept;

} // namespace tamblo
