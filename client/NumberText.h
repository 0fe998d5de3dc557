#pragma once

#include <charconv>
#include <cstdint>
#include <optional>
#include <string_view>

namespace tamblo::client {

/// A whole text that is a number, decimal or with 0x.
[[nodiscard]] inline std::optional<std::uint64_t> parseUnsigned(std::string_view text) {
    const bool isHexadecimal = text.starts_with("0x") || text.starts_with("0X");
    text.remove_prefix(isHexadecimal ? 2 : 0);
    std::uint64_t number = 0;
    const auto [end, error] =
        std::from_chars(text.data(), text.data() + text.size(), number, isHexadecimal ? 16 : 10);
    if (error != std::errc() || end != text.data() + text.size()) {
        return std::nullopt;
    }
    return number;
}

[[nodiscard]] inline std::optional<std::int64_t> parseInteger(std::string_view text) {
    std::int64_t number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    if (error != std::errc() || end != text.data() + text.size()) {
        return std::nullopt;
    }
    return number;
}

} // namespace tamblo::client
