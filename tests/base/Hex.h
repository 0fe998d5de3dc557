#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo::test {

/// The bytes of hexadecimal digits, two each; blanks between them do not count.
inline std::vector<std::uint8_t> fromHex(std::string_view hex) {
    std::vector<std::uint8_t> bytes;
    std::string pair;
    for (const char digit : hex) {
        if (digit != ' ' && (pair += digit).size() == 2) {
            bytes.push_back(static_cast<std::uint8_t>(std::stoi(std::exchange(pair, ""), nullptr, 16)));
        }
    }
    return bytes;
}

} // namespace tamblo::test
