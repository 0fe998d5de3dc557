#include "bridge/common/CleanText.h"

#include "base/Utf8.h"

#include <algorithm>

#include <arpa/inet.h>

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

/// Of the internet, in brackets or not, and with a port or not.
bool isNetworkAddress(std::string_view word) {
    const std::size_t begin = std::min(word.find_first_not_of("([{"), word.size());
    std::string text(word.substr(begin, word.find_first_of(")]}%,", begin) - begin));
    in6_addr address{};
    if (::inet_pton(AF_INET6, text.c_str(), &address) == 1) {
        return true;
    }
    text.resize(std::min(text.find(':'), text.size()));
    return ::inet_pton(AF_INET, text.c_str(), &address) == 1;
}

/// As descriptions have it of devices that another machine lends: "Tunnel for anna@192.168.7.9".
bool namesUserOrMachine(std::string_view word) {
    constexpr std::size_t kLongestAddress = 64;
    const std::size_t at = word.find('@');
    return (at != word.npos && at != 0 && at + 1 != word.size()) ||
           (word.size() <= kLongestAddress && isNetworkAddress(word));
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
    bool beginsWord = true;
    while (!text.empty() && clean.size() < mostBytes) {
        const std::string_view word = text.substr(0, beginsWord ? text.find(' ') : 0);
        beginsWord = text.front() == ' ';
        if (!word.empty() && namesUserOrMachine(word)) {
            text.remove_prefix(word.size());
            continue;
        }
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
