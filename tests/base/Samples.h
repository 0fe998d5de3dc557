#pragma once

#include <cstdint>
#include <random>
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

inline std::string repeated(std::string_view piece, int count) {
    std::string text;
    while (count-- > 0) {
        text += piece;
    }
    return text;
}

/// JSON at random from a seed: texts of every length around what is stored in place, numbers of every
/// magnitude.
class RandomJson {
public:
    explicit RandomJson(std::uint32_t seed) : random_(seed) {}

    std::string value(int depth) {
        switch (below(depth > 0 ? 8 : 5)) {
        case 0:
            return below(2) == 0 ? "true" : "false";
        case 1:
            return integer();
        case 2:
            return integer() + "." + std::to_string(below(1000)) + "e" + std::to_string(below(40));
        case 5:
            return "[" + items([&](std::size_t) { return value(depth - 1); }) + "]";
        case 6:
        case 7:
            return object(depth);
        default:
            return "\"" + characters() + "\"";
        }
    }
    /// No key twice.
    std::string object(int depth) {
        return "{" + items([&](std::size_t number) {
                   return "\"" + characters() + std::to_string(number) + "\":" + value(depth - 1);
               }) +
               "}";
    }

    std::size_t below(std::size_t limit) { return random_() % limit; }

private:
    template <typename Item> std::string items(const Item& item) {
        std::string text;
        for (std::size_t i = below(6); i > 0; --i) {
            text += item(i) + (i > 1 ? "," : "");
        }
        return text;
    }

    /// Every second one is a power of two or stands beside one.
    std::string integer() {
        const std::uint64_t power = 1ULL << (1 + below(63));
        const std::uint64_t number = below(2) == 0 ? power + below(3) - 1 : random_() % power;
        return below(3) == 0 && power <= 1ULL << 62 ? "-" + std::to_string(number) : std::to_string(number);
    }

    std::string characters() {
        static const std::vector<std::string> pieces{
            "a", "Z", "0", " ", "\\\"", "\\\\", "/", "\\n", "\\u0000", "\x7f", "é", "水", "𐅑", "reporting"};
        std::string text;
        for (std::size_t i = below(22); i > 0; --i) {
            text += pieces[below(4) == 0 ? below(pieces.size()) : below(3)];
        }
        return text;
    }

    std::mt19937_64 random_;
};

} // namespace tamblo::test
