#pragma once

#include "base/Dictionary.h"
#include "base/Value.h"

#include <bit>
#include <cmath>
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

/// Values that JSON has, at random from a seed: every length around the limits of what is stored in place,
/// numbers of every magnitude.
class RandomValues {
public:
    explicit RandomValues(std::uint32_t seed) : random_(seed) {}

    Value value(int depth) {
        switch (below(depth > 0 ? 8U : 5U)) {
        case 0:
            return below(2) == 0;
        case 1:
            return static_cast<std::int64_t>(below(2) == 0 ? bits() : ~bits());
        case 2:
            return bits();
        case 3:
            return real();
        case 5: {
            Array elements;
            for (std::size_t i = below(5); i > 0; --i) {
                elements.push_back(value(depth - 1));
            }
            return elements;
        }
        case 6:
        case 7:
            return dictionary(depth - 1);
        default:
            return text();
        }
    }

    Dictionary dictionary(int depth) {
        Dictionary dictionary;
        for (std::size_t i = below(6); i > 0; --i) {
            dictionary.set(text(), value(depth));
        }
        return dictionary;
    }

    std::size_t below(std::size_t limit) { return random_() % limit; }

private:
    std::string text() {
        static const std::vector<std::string> pieces{"a",  "Z",    "0", " ",  "\"", "\\",       "/",
                                                     "\n", "\x7f", "é", "水", "𐅑",  "reporting"};
        std::string text;
        for (std::size_t i = below(22); i > 0; --i) {
            text += pieces[below(4) == 0 ? below(pieces.size()) : below(3)];
        }
        return text;
    }

    /// Magnitudes are spread evenly over the lengths in bits; every second number is a power of two or stands
    /// beside one.
    std::uint64_t bits() {
        const std::uint64_t power = 1ULL << below(64);
        return below(2) == 0 ? power + below(3) - 1 : random_() % power;
    }

    double real() {
        const auto number = std::bit_cast<double>(random_());
        return below(3) == 0 && std::isfinite(number)
                   ? number
                   : static_cast<double>(static_cast<std::int64_t>(bits())) /
                         static_cast<double>(bits() | 1U);
    }

    std::mt19937_64 random_;
};

} // namespace tamblo::test
