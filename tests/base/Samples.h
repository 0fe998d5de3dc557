#pragma once

#include "base/Dictionary.h"
#include "base/Value.h"

#include <nlohmann/json.hpp>

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
    for (int i = 0; i < count; ++i) {
        text += piece;
    }
    return text;
}

/// Values at random from a seed: every kind, every length around the limits of what is stored in place,
/// numbers of every magnitude.
class RandomValues {
public:
    explicit RandomValues(std::uint32_t seed) : random_(seed) {}

    /// With `onlyJson` nothing but what JSON has of its own.
    Value value(int depth, bool onlyJson) {
        switch (below(depth > 0 ? (onlyJson ? 8U : 10U) : 5U)) {
        case 0:
            return Value(below(2) == 0);
        case 1:
            return Value(static_cast<std::int64_t>(below(2) == 0 ? bits() : ~bits()));
        case 2:
            return Value(bits());
        case 3:
            return real(onlyJson);
        case 5: {
            Array elements;
            for (std::size_t i = below(5); i > 0; --i) {
                elements.push_back(value(depth - 1, onlyJson));
            }
            return Value(std::move(elements));
        }
        case 6:
        case 7:
            return Value(dictionary(depth - 1, onlyJson));
        case 8: {
            std::vector<std::uint8_t> bytes(below(40));
            for (auto& byte : bytes) {
                byte = static_cast<std::uint8_t>(bits());
            }
            return Value::data(bytes);
        }
        case 9:
            return below(2) == 0 ? Value(static_cast<float>(static_cast<int>(bits()))) : Value(small());
        default:
            return Value(text());
        }
    }

    Dictionary dictionary(int depth, bool onlyJson) {
        Dictionary dictionary;
        for (std::size_t i = below(6); i > 0; --i) {
            dictionary.set(text(), value(depth, onlyJson));
        }
        return dictionary;
    }

    std::string text() {
        static const std::vector<std::string> pieces{
            "a",    "Z",    "0", " ",  "\"", "\\",        "/", "\n", std::string(1, '\0'),
            "\x1f", "\x7f", "é", "水", "𐅑",  "reporting", "\t"};
        std::string text;
        for (std::size_t i = below(22); i > 0; --i) {
            text += pieces[below(4) == 0 ? below(pieces.size()) : below(3)];
        }
        return text;
    }

    std::size_t below(std::size_t limit) { return random_() % limit; }

private:
    /// Magnitudes are spread evenly over the lengths in bits; every second number is a power of two or stands
    /// beside one.
    std::uint64_t bits() {
        const std::uint64_t power = 1ULL << below(64);
        return below(2) == 0 ? power + below(3) - 1 : random_() % power;
    }
    std::int64_t small() { return static_cast<std::int64_t>(below(2000)) - 1000; }

    Value real(bool onlyJson) {
        double number = std::bit_cast<double>(random_());
        if (below(3) != 0 || !std::isfinite(number)) {
            number =
                static_cast<double>(static_cast<std::int64_t>(bits())) / static_cast<double>(1U << below(20));
        }
        return !onlyJson && below(2) == 0 ? Value(static_cast<float>(number)) : Value(number);
    }

    std::mt19937_64 random_;
};

/// The same document for the independent implementation that the codecs are held against.
inline nlohmann::json toNlohmann(const Value& value) {
    switch (value.kind()) {
    case Value::Kind::boolean:
        return value.boolValue();
    case Value::Kind::integer:
        return value.rawInteger();
    case Value::Kind::unsignedInteger:
        return value.rawUnsigned();
    case Value::Kind::singleFloat:
    case Value::Kind::doubleFloat:
        return value.doubleValue();
    case Value::Kind::data:
        return nlohmann::json::binary({value.dataValue().begin(), value.dataValue().end()});
    case Value::Kind::array: {
        auto array = nlohmann::json::array();
        for (const Value& element : value.arrayValue()) {
            array.push_back(toNlohmann(element));
        }
        return array;
    }
    case Value::Kind::dictionary: {
        auto object = nlohmann::json::object();
        const Dictionary& dictionary = value.dictionaryValue();
        for (std::size_t i = 0; i < dictionary.size(); ++i) {
            object[std::string(dictionary.keyAt(i))] = toNlohmann(dictionary.valueAt(i));
        }
        return object;
    }
    default:
        return std::string(value.stringValue());
    }
}

} // namespace tamblo::test
