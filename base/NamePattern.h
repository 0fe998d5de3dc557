#pragma once

#include <string_view>

namespace tamblo {

/// Whether a name is the pattern, or, where that ends with `*`, begins with what stands in front.
[[nodiscard]] constexpr bool matchesPattern(std::string_view name, std::string_view pattern) noexcept {
    return pattern.ends_with('*') ? name.starts_with(pattern.substr(0, pattern.size() - 1)) : name == pattern;
}

} // namespace tamblo
