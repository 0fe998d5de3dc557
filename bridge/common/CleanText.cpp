#include "bridge/common/CleanText.h"

#include "base/Utf8.h"

#include <algorithm>

namespace tamblo::bridge {

namespace {

constexpr std::size_t kAddressBytes = 17; ///< "01:23:45:67:89:AB"

bool isHexadecimal(char byte) noexcept {
    return (byte >= '0' && byte <= '9') || (byte >= 'a' && byte <= 'f') || (byte >= 'A' && byte <= 'F');
}

bool beginsWithAddress(std::string_view text) noexcept {
    if (text.size() < kAddressBytes) {
        return false;
    }
    for (std::size_t i = 0; i < kAddressBytes; ++i) {
        const bool isBetween = i % 3 == 2;
        if (isBetween ? text[i] != text[2] : !isHexadecimal(text[i])) {
            return false;
        }
    }
    return text[2] == ':' || text[2] == '_' || text[2] == '-';
}

/// The bytes of the well-formed character that the text begins with; 0 where it begins with none.
std::size_t characterLength(std::string_view text) noexcept {
    for (std::size_t length = 1; length <= std::min<std::size_t>(text.size(), 4); ++length) {
        if (isUtf8(text.substr(0, length))) {
            return length;
        }
    }
    return 0;
}

} // namespace

std::string cleanText(std::string_view text, std::size_t mostBytes) {
    std::string clean;
    while (!text.empty() && clean.size() < mostBytes) {
        if (beginsWithAddress(text)) {
            text.remove_prefix(kAddressBytes);
            continue;
        }
        const std::size_t length = characterLength(text);
        if (length == 0) {
            clean += '?';
        } else if (controlLength(text, 0) != 0) {
            clean += ' ';
        } else if (clean.size() + length > mostBytes) {
            break;
        } else {
            clean += text.substr(0, length);
        }
        text.remove_prefix(std::max<std::size_t>(length, 1));
    }
    const std::size_t begin = std::min(clean.find_first_not_of(" ._-"), clean.size());
    clean.erase(0, begin);
    clean.erase(clean.find_last_not_of(" ._-") + 1);
    return clean;
}

} // namespace tamblo::bridge
