#include "base/Value.h"
#include "base/Json.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <limits>
#include <string>
#include <vector>

namespace tamblo {
namespace {

constexpr double kNan = std::numeric_limits<double>::quiet_NaN();
constexpr std::int64_t kMost = std::numeric_limits<std::int64_t>::max();
constexpr std::uint64_t kMostUnsigned = std::numeric_limits<std::uint64_t>::max();
constexpr std::int64_t k2To53 = std::int64_t{1} << 53;

TEST(Value, NumbersAreEqualByValueAcrossKinds) {
    const std::vector<std::vector<Value>> classes{
        {0, false, 0.0, -0.0, 0.0F, -0.0F, 0U, Value()},
        {1, true, 1.0, 1.0F, 1U},
        {0.1F, static_cast<double>(0.1F)},
        {k2To53, static_cast<double>(k2To53), static_cast<float>(k2To53)},
        {k2To53 + 1, static_cast<std::uint64_t>(k2To53) + 1},
        {kMost, static_cast<std::uint64_t>(kMost)},
        {std::uint64_t{1} << 63U, 0x1p63, 0x1p63F},
        {kMostUnsigned},
        {0x1p64, 0x1p64F},
        {-kMost - 1, -0x1p63, -0x1p63F},
        {kNan, std::numeric_limits<float>::quiet_NaN(), -kNan},
        {""},
        {Value::date(1)},
        {Value::date(kNan), Value::date(-kNan)},
        {Value::data({})},
        {Value(Dictionary{})},
        {Value(Array{1, "a"}), Value(Array{1.0, "a"})},
        {Value(Dictionary{{"a", 1}}), Value(Dictionary{{"a", true}})},
        {Value(Dictionary{{"b", 1}})}};
    for (const auto& some : classes) {
        for (const auto& others : classes) {
            for (const Value& a : some) {
                for (const Value& b : others) {
                    EXPECT_EQ(a == b, &some == &others) << jsonText(Array{a, b});
                }
            }
        }
    }
}

TEST(Value, ReadingANumberNeverFails) {
    const struct {
        Value value;
        double real;
        std::int64_t integer;
        std::uint64_t natural;
        bool truth;
    } rows[] = {{true, 1, 1, 1, true},
                {-7, -7, -7, 0, true},
                {-2.9, -2.9, -2, 0, true},
                {0.5F, 0.5, 0, 0, true},
                {kMostUnsigned, 0x1p64, kMost, kMostUnsigned, true},
                {std::numeric_limits<float>::quiet_NaN(), kNan, 0, 0, false},
                {1e300, 1e300, kMost, kMostUnsigned, true},
                {-0.0, 0, 0, 0, false},
                {" \t-3.75e1x", -37.5, -37, 0, true},
                {"0." + std::string(400, '0') + "1", 0, 0, 0, false},
                {std::string(400, '1'), std::numeric_limits<double>::infinity(), kMost, kMostUnsigned, true},
                {"9223372036854775807", 0x1p63, kMost, static_cast<std::uint64_t>(kMost), true},
                {"99999999999999999999", 99999999999999999999.0, kMost, kMostUnsigned, true},
                {"-", 0, 0, 0, false},
                {"YES", 0, 0, 0, true},
                {Value::date(5), 0, 0, 0, false},
                {Value(Dictionary{{"a", 1}}), 0, 0, 0, false}};
    for (const auto& [value, real, integer, natural, truth] : rows) {
        EXPECT_EQ(Value(value.doubleValue()), Value(real)) << jsonText(value);
        EXPECT_EQ(value.integerValue(), integer) << jsonText(value);
        EXPECT_EQ(value.unsignedValue(), natural) << jsonText(value);
        EXPECT_EQ(value.boolValue(), truth) << jsonText(value);
    }
}

TEST(Value, KeepsItsContent) {
    // Lengths on both sides of what lies in the value itself, through copy, move and assignment to itself.
    for (const std::size_t length : {0U, 1U, 14U, 15U, 254U, 255U, 256U, 70'000U}) {
        std::string text(length, 'x');
        text[length / 2] = '\0';
        Value value(text);
        Value copy = value;
        Value moved = std::move(value);
        const Value& self = copy;
        copy = self;
        EXPECT_EQ(copy.stringValue(), text);
        EXPECT_EQ(moved, copy);
        EXPECT_NE(moved, Value(text + "y"));
        const std::vector<std::uint8_t> bytes(text.begin(), text.end());
        const Value data = Value::data(bytes);
        EXPECT_TRUE(std::ranges::equal(bytes, data.dataValue()));
        EXPECT_NE(data, copy);
    }
}

} // namespace
} // namespace tamblo
