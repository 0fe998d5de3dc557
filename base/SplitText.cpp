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

} // namespace tamblo
