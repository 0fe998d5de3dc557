#include "base/SplitText.h"

#include <algorithm>

namespace tamblo {

std::string_view trimmed(std::string_view text) noexcept {
    constexpr std::string_view kWhiteSpace = " \t\r\n\v\f";
    text.remove_prefix(std::min(text.find_first_not_of(kWhiteSpace), text.size()));
    return text.substr(0, text.find_last_not_of(kWhiteSpace) + 1);
}

std::string_view takeUpTo(char separator, std::string_view& text) noexcept {
    const std::string_view taken = text.substr(0, text.find(separator));
    text.remove_prefix(std::min(taken.size() + 1, text.size()));
    return taken;
}

std::optional<std::string_view> fieldOf(std::string_view text, std::string_view name) noexcept {
    while (!text.empty()) {
        std::string_view line = takeUpTo('\n', text);
        if (line.starts_with(name) && line.find(':') != std::string_view::npos &&
            trimmed(takeUpTo(':', line)) == name) {
            return trimmed(line);
        }
    }
    return std::nullopt;
}

} // namespace tamblo
