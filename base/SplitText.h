#pragma once

#include <string_view>

namespace tamblo {

/// Pieces of the small texts that kernel, daemons and administrators write.

/// Without the white space at both ends.
[[nodiscard]] std::string_view trimmed(std::string_view text) noexcept;

/// Takes the text up to the separator, or all of it, off the front, and the separator with it.
std::string_view takeUpTo(char separator, std::string_view& text) noexcept;

} // namespace tamblo
