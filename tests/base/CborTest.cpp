#include "base/Cbor.h"
#include "tests/base/AllocationCount.h"
#include "tests/base/RandomValues.h"

#include <gtest/gtest.h>

#include <array>
#include <charconv>
#include <limits>
#include <string>
#include <variant>
#include <vector>

namespace tamblo {
namespace {

using Bytes = std::vector<std::uint8_t>;
using Outcome = std::variant<Value, CborError>;

Bytes unhex(std::string_view hex) {
    Bytes bytes(hex.size() / 2);
    for (std::size_t i = 0; i < bytes.size(); ++i) {
        std::from_chars(hex.data() + 2 * i, hex.data() + 2 * i + 2, bytes[i], 16);
    }
    return bytes;
}

std::string repeated(std::string_view piece, int count) {
    std::string text;
    for (int i = 0; i < count; ++i) {
        text += piece;
    }
    return text;
}

/// Reads one item, with and without the memory of key sets, which must not make a difference.
Outcome read(std::span<const std::uint8_t> bytes) {
    KeySetCache cache;
    CborReader plain(bytes);
    const auto value = plain.readValue();
    for (int round = 0; round < 2; ++round) {
        CborReader cached(bytes, &cache);
        EXPECT_EQ(cached.readValue(), value);
        EXPECT_EQ(cached.error(), plain.error());
    }
    EXPECT_EQ(value.has_value(), plain.error() == CborError::none);
    if (!value) {
        EXPECT_EQ(plain.peek(), CborReader::Type::end);
        return plain.error();
    }
    EXPECT_TRUE(plain.atEnd());
    return *value;
}

Bytes written(const Value& value) {
    TextBuffer out;
    CborWriter(out).value(value);
    return {out.bytes().begin(), out.bytes().end()};
}

bool skips(const Bytes& bytes) {
    CborReader reader(bytes);
    const bool whole = reader.skip();
    EXPECT_EQ(whole, reader.error() == CborError::none);
    EXPECT_TRUE(!whole || reader.atEnd());
    return whole;
}

Value counted(int last) {
    Array elements;
    for (int i = 1; i <= last; ++i) {
        elements.emplace_back(i);
    }
    return elements;
}

struct Example {
    const char* hex;
    Outcome expected;
};

const std::vector<Example>& appendixA() {
    constexpr double infinity = std::numeric_limits<double>::infinity();
    constexpr float infinityF = std::numeric_limits<float>::infinity();
    constexpr double nan = std::numeric_limits<double>::quiet_NaN();
    constexpr float nanF = std::numeric_limits<float>::quiet_NaN();
    static const Bytes four{1, 2, 3, 4};
    static const Bytes five{1, 2, 3, 4, 5};
    static const Value nested = Array{1, Array{2, 3}, Array{4, 5}};
    static const std::vector<Example> examples{
        {"00", 0},
        {"01", 1},
        {"0a", 10},
        {"17", 23},
        {"1818", 24},
        {"1819", 25},
        {"1864", 100},
        {"1903e8", 1000},
        {"1a000f4240", 1000000},
        {"1b000000e8d4a51000", 1000000000000},
        {"1bffffffffffffffff", 18446744073709551615U},
        {"c249010000000000000000", CborError::unsupportedTag},
        {"3bffffffffffffffff", CborError::integerOutOfRange},
        {"c349010000000000000000", CborError::unsupportedTag},
        {"20", -1},
        {"29", -10},
        {"3863", -100},
        {"3903e7", -1000},
        {"f90000", 0.0F},
        {"f98000", -0.0F},
        {"f93c00", 1.0F},
        {"fb3ff199999999999a", 1.1},
        {"f93e00", 1.5F},
        {"f97bff", 65504.0F},
        {"fa47c35000", 100000.0F},
        {"fa7f7fffff", 3.4028234663852886e+38F},
        {"fb7e37e43c8800759c", 1.0e+300},
        {"f90001", 5.960464477539063e-8F},
        {"f90400", 0.00006103515625F},
        {"f9c400", -4.0F},
        {"fbc010666666666666", -4.1},
        {"f97c00", infinityF},
        {"f97e00", nanF},
        {"f9fc00", -infinityF},
        {"fa7f800000", infinityF},
        {"fa7fc00000", nanF},
        {"faff800000", -infinityF},
        {"fb7ff0000000000000", infinity},
        {"fb7ff8000000000000", nan},
        {"fbfff0000000000000", -infinity},
        {"f4", false},
        {"f5", true},
        {"f6", CborError::nullValue},
        {"f7", CborError::nullValue},
        {"f0", CborError::unsupportedSimple},
        {"f8ff", CborError::unsupportedSimple},
        {"c074323031332d30332d32315432303a30343a30305a", CborError::unsupportedTag},
        {"c11a514b67b0", Value::date(1363896240)},
        {"c1fb41d452d9ec200000", Value::date(1363896240.5)},
        {"d74401020304", CborError::unsupportedTag},
        {"d818456449455446", CborError::unsupportedTag},
        {"d82076687474703a2f2f7777772e6578616d706c652e636f6d", CborError::unsupportedTag},
        {"40", Value::data({})},
        {"4401020304", Value::data(four)},
        {"60", ""},
        {"6161", "a"},
        {"6449455446", "IETF"},
        {"62225c", "\"\\"},
        {"62c3bc", "\xC3\xBC"},
        {"63e6b0b4", "\xE6\xB0\xB4"},
        {"64f0908591", "\xF0\x90\x85\x91"},
        {"80", Array{}},
        {"83010203", counted(3)},
        {"8301820203820405", nested},
        {"98190102030405060708090a0b0c0d0e0f101112131415161718181819", counted(25)},
        {"a0", Dictionary{}},
        {"a201020304", CborError::keyNotText},
        {"a26161016162820203", Dictionary{{"a", 1}, {"b", Array{2, 3}}}},
        {"826161a161626163", Array{"a", Dictionary{{"b", "c"}}}},
        {"a56161614161626142616361436164614461656145",
         Dictionary{{"a", "A"}, {"b", "B"}, {"c", "C"}, {"d", "D"}, {"e", "E"}}},
        {"5f42010243030405ff", Value::data(five)},
        {"7f657374726561646d696e67ff", "streaming"},
        {"9fff", Array{}},
        {"9f018202039f0405ffff", nested},
        {"9f01820203820405ff", nested},
        {"83018202039f0405ff", nested},
        {"83019f0203ff820405", nested},
        {"9f0102030405060708090a0b0c0d0e0f101112131415161718181819ff", counted(25)},
        {"bf61610161629f0203ffff", Dictionary{{"a", 1}, {"b", Array{2, 3}}}},
        {"826161bf61626163ff", Array{"a", Dictionary{{"b", "c"}}}},
        {"bf6346756ef563416d7421ff", Dictionary{{"Fun", true}, {"Amt", -2}}},
    };
    return examples;
}

TEST(Cbor, ReadsTheExamplesOfTheStandard) {
    for (const auto& [hex, expected] : appendixA()) {
        const Bytes bytes = unhex(hex);
        const Outcome outcome = read(bytes);
        EXPECT_EQ(outcome, expected) << hex;
        EXPECT_TRUE(skips(bytes)) << hex;
        const Value* const value = std::get_if<Value>(&outcome);
        if (value == nullptr || !std::holds_alternative<Value>(expected)) {
            continue;
        }
        EXPECT_EQ(value->kind(), std::get<Value>(expected).kind()) << hex;
        const Bytes again = written(*value);
        EXPECT_LE(again.size(), bytes.size() + (bytes[0] == 0xF9 ? 2U : bytes[0] == 0xC1 ? 4U : 0U)) << hex;
        const Outcome reread = read(again);
        ASSERT_TRUE(std::holds_alternative<Value>(reread)) << hex;
        EXPECT_EQ(std::get<Value>(reread), *value) << hex;
        EXPECT_EQ(std::get<Value>(reread).kind(), value->kind()) << hex;
    }
}

TEST(Cbor, RefusesWhatIsNoValue) {
    const std::vector<Example> rows{
        {"a16161f6", CborError::nullValue},
        {"81f7", CborError::nullValue},
        {"c1f6", CborError::nullValue},
        {"c16131", CborError::unsupportedTag},
        {"c1c101", CborError::unsupportedTag},
        {"81d9d9f701", CborError::unsupportedTag},
        {"e0", CborError::unsupportedSimple},
        {"f3", CborError::unsupportedSimple},
        {"f820", CborError::unsupportedSimple},
        {"a1416101", CborError::keyNotText},
        {"bff500ff", CborError::keyNotText},
        {"a2616101616102", CborError::duplicateKey},
        {"a3616201616102616203", CborError::duplicateKey},
        {"bf6161016161f5ff", CborError::duplicateKey},
        {"a27f6161ff01616102", CborError::duplicateKey},
        {"8181a2616101616102", CborError::duplicateKey},
        {"61ff", CborError::notUtf8},
        {"62c080", CborError::notUtf8},
        {"63eda080", CborError::notUtf8},
        {"a161ff01", CborError::notUtf8},
        {"7f61c361bcff", CborError::notUtf8}, // each chunk stands for itself (section 3.2.3)
        {"3b8000000000000000", CborError::integerOutOfRange},
        {"3b7fffffffffffffff", std::numeric_limits<std::int64_t>::min()},
        {"1b8000000000000000", 9223372036854775808U},
        {"1b0000000000000001", 1},
        {"7fff", ""},
        {"5fff", Value::data({})},
        {"bfff", Dictionary{}},
        {"bf7f616161626163ff01ff", Dictionary{{"abc", 1}}},
        {"c1fa00000000", Value::date(0)},
        {"c1f93e00", Value::date(1.5)},
        {"c120", Value::date(-1)},
    };
    for (const auto& [hex, expected] : rows) {
        EXPECT_EQ(read(unhex(hex)), expected) << hex;
        EXPECT_TRUE(skips(unhex(hex))) << hex;
    }
}

TEST(Cbor, KnowsWhatIsNotWellFormed) {
    const std::vector<const char*> malformed{
        "1c",       "1d",           "1e",         "3c",     "3e",     "5c",     "7d",           "9e",
        "bc",       "dd",           "fc",         "fd",     "fe",     "f800",   "f818",         "f81f",
        "5f00ff",   "5f21ff",       "5f6100ff",   "5f80ff", "5fa0ff", "5fc000ff", "5fe0ff",     "7f4100ff",
        "ff",       "81ff",         "8200ff",     "a1ff",   "a26161ff", "a26161016162ff", "9f81ff",
        "bf6161ff", "1f", "3f",   "df",     "c1ff",   "5f5f4100ffff", "7f7f6100ffff",
    };
    const std::vector<const char*> truncated{
        "",         "18",     "19",         "1a",       "1b",         "1901",   "1a0102", "1b01020304050607",
        "38",       "58",     "78",         "98",       "9a01ff00",   "b8",     "d8",     "f8",
        "f900",     "fa0000", "fb000000",   "41",       "61",         "5affffffff00",     "5bffffffffffffffff010203",
        "81",       "8200",   "7affffffff00", "7b7fffffffffffffff010203", "a1"};
    for (const char* hex : malformed) {
        const Outcome outcome = read(unhex(hex));
        ASSERT_TRUE(std::holds_alternative<CborError>(outcome)) << hex;
        EXPECT_EQ(std::get<CborError>(outcome), CborError::malformed) << hex;
        EXPECT_FALSE(skips(unhex(hex))) << hex;
    }
    for (const char* hex : truncated) {
        EXPECT_EQ(read(unhex(hex)), Outcome(CborError::truncated)) << hex;
        EXPECT_FALSE(skips(unhex(hex))) << hex;
    }
}

TEST(Cbor, FindsTheTruncationAtEveryByte) {
    const Dictionary everything{{"array", Array{1, -300, 70000, Array{}, "text"}},
                                {"data", Value::data(Bytes(30, 7))},
                                {"date", Value::date(1.25)},
                                {"double", 0.1},
                                {"large", 18446744073709551615U},
                                {"map", Dictionary{{"inner", true}, {"single", 0.5F}}},
                                {"text", std::string(300, 'x')}};
    const Bytes indefinite = unhex("bf61617f616162c3a9ff61625f42010243030405ff61639fc101bf6161f97e00ffffff");
    for (const Bytes& bytes : {written(everything), indefinite}) {
        EXPECT_TRUE(std::holds_alternative<Value>(read(bytes)));
        for (std::size_t length = 0; length < bytes.size(); ++length) {
            // A copy of its own length, so that a memory checker sees a step beyond it.
            const Bytes part(bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(length));
            EXPECT_EQ(read(part), Outcome(CborError::truncated)) << length;
            EXPECT_FALSE(skips(part)) << length;
        }
    }
}

TEST(Cbor, AllocatesNothingFromADeclaredCount) {
    for (const char* head : {"9b1000000000000000", "bb1000000000000000", "5b1000000000000000", "7b1000000000000000",
                             "9a40000000", "ba40000000", "5a40000000", "7a40000000", "9bffffffffffffffff",
                             "bbffffffffffffffff", "bb8000000000000000", "7bffffffffffffffff"}) {
        for (const char* rest : {"", "616101", "0000"}) {
            const Bytes bytes = unhex(std::string(head) + rest);
            KeySetCache cache;
            const auto spent = test::allocationsOf([&] {
                CborReader reader(bytes, &cache);
                EXPECT_EQ(reader.readValue(), std::nullopt);
                EXPECT_NE(reader.error(), CborError::none);
            });
            EXPECT_LT(spent.bytes, 20'000U) << head << rest;
            EXPECT_FALSE(skips(bytes)) << head << rest;
        }
    }
}

TEST(Cbor, NestsToItsDepth) {
    const int most = CborReader::kMaximumDepth;
    for (const auto& [open, close] : std::vector<std::pair<std::string, std::string>>{
             {"81", ""}, {"9f", "ff"}, {"a16161", ""}, {"bf6161", "ff"}}) {
        const auto nested = [&](int depth) { return unhex(repeated(open, depth) + "01" + repeated(close, depth)); };
        EXPECT_TRUE(std::holds_alternative<Value>(read(nested(most)))) << open;
        EXPECT_EQ(read(nested(most + 1)), Outcome(CborError::tooDeep)) << open;
        EXPECT_FALSE(std::holds_alternative<Value>(read(nested(200'000)))) << open;
        CborReader(nested(200'000)).skip();
    }
    EXPECT_FALSE(std::holds_alternative<Value>(read(unhex(repeated("c1", 200'000) + "01"))));
    CborReader(unhex(repeated("c1", 200'000) + "01")).skip();
}

TEST(Cbor, ReadsItemByItem) {
    const Bytes bytes = unhex("8500206161f5f6");
    CborReader reader(bytes);
    EXPECT_EQ(reader.peek(), CborReader::Type::array);
    EXPECT_EQ(reader.readUnsigned(), std::nullopt);
    auto head = reader.readArrayHead();
    ASSERT_TRUE(head && head->count == 5U);
    EXPECT_TRUE(reader.moreElements(*head));
    EXPECT_EQ(reader.readText(), std::nullopt);
    EXPECT_EQ(reader.readUnsigned(), 0U);
    EXPECT_TRUE(reader.moreElements(*head));
    EXPECT_EQ(reader.readUnsigned(), std::nullopt);
    EXPECT_EQ(reader.readInteger(), -1);
    EXPECT_TRUE(reader.moreElements(*head));
    EXPECT_EQ(reader.readText(), "a");
    EXPECT_TRUE(reader.moreElements(*head));
    EXPECT_FALSE(reader.readNull());
    EXPECT_EQ(reader.readBoolean(), true);
    EXPECT_TRUE(reader.moreElements(*head));
    EXPECT_TRUE(reader.nextIsNull());
    EXPECT_TRUE(reader.readNull());
    EXPECT_FALSE(reader.moreElements(*head));
    EXPECT_TRUE(reader.atEnd());
    EXPECT_EQ(reader.error(), CborError::none);

    const Bytes indefinite = unhex("9f0102ff05");
    CborReader second(indefinite);
    head = second.readArrayHead();
    ASSERT_TRUE(head && !head->count);
    int sum = 0;
    while (second.moreElements(*head)) {
        sum += static_cast<int>(second.readUnsigned().value_or(100));
    }
    EXPECT_EQ(sum, 3);
    EXPECT_EQ(second.readUnsigned(), 5U);

    const Bytes cut = unhex("9f01");
    CborReader third(cut);
    head = third.readArrayHead();
    ASSERT_TRUE(head && third.moreElements(*head));
    EXPECT_EQ(third.readInteger(), 1);
    EXPECT_FALSE(third.moreElements(*head));
    EXPECT_EQ(third.error(), CborError::truncated);
}

TEST(Cbor, AgreesWithAnIndependentImplementation) {
    test::RandomValues random(7);
    for (int i = 0; i < 3000; ++i) {
        const Value value = random.value(4, false);
        const Bytes bytes = written(value);
        EXPECT_EQ(nlohmann::json::from_cbor(bytes), test::toNlohmann(value));
        EXPECT_EQ(read(bytes), Outcome(value));

        const nlohmann::json theirs = test::toNlohmann(random.value(4, false));
        const Outcome ours = read(nlohmann::json::to_cbor(theirs));
        ASSERT_TRUE(std::holds_alternative<Value>(ours)) << theirs;
        EXPECT_EQ(test::toNlohmann(std::get<Value>(ours)), theirs);
    }
    EXPECT_EQ(written(Value(0.1F)), unhex("fa3dcccccd"));
    EXPECT_EQ(written(Value(1.0)), unhex("fb3ff0000000000000"));
    EXPECT_EQ(written(Value(Dictionary{{"b", 24}, {"a", -257}})), unhex("a26161390100" "61621818"));
}

TEST(KeySetCache, SharesTheKeySetsOfOneShape) {
    KeySetCache cache;
    const auto readMap = [&cache](std::string_view hex) {
        const Bytes bytes = unhex(hex);
        auto map = CborReader(bytes, &cache).readDictionary(2);
        EXPECT_TRUE(map) << hex;
        return map.value_or(Dictionary{});
    };
    const Dictionary first = readMap("a3616101616202616303");
    const Dictionary same = readMap("a3616105616206616307");
    EXPECT_EQ(&first.keys(), &same.keys());
    EXPECT_EQ(same, (Dictionary{{"a", 5}, {"b", 6}, {"c", 7}}));

    const Dictionary reordered = readMap("a3616303616101616202");
    EXPECT_EQ(reordered, first);
    EXPECT_EQ(reordered.keys(), first.keys());
    EXPECT_EQ(readMap("a3616309616107616208"), (Dictionary{{"a", 7}, {"b", 8}, {"c", 9}}));

    // Shapes that begin like a remembered one and then differ, end early or go on.
    EXPECT_EQ(readMap("a3616101616202616403"), (Dictionary{{"a", 1}, {"b", 2}, {"d", 3}}));
    EXPECT_EQ(readMap("a3616101616402616303"), (Dictionary{{"a", 1}, {"c", 3}, {"d", 2}}));
    EXPECT_EQ(readMap("a2616101616202"), (Dictionary{{"a", 1}, {"b", 2}}));
    EXPECT_EQ(readMap("bf616101616202616303616404ff"), (Dictionary{{"a", 1}, {"b", 2}, {"c", 3}, {"d", 4}}));
    EXPECT_EQ(readMap("bf616101616202ff"), (Dictionary{{"a", 1}, {"b", 2}}));

    for (const char* twice : {"a3616101616202616203", "a3616101616202616103", "a3616101616101616303"}) {
        const Bytes bytes = unhex(twice);
        CborReader reader(bytes, &cache);
        EXPECT_EQ(reader.readDictionary(), std::nullopt);
        EXPECT_EQ(reader.error(), CborError::duplicateKey) << twice;
    }
    EXPECT_EQ(&readMap("a3616105616206616307").keys(), &first.keys());
}

TEST(KeySetCache, ReadsRightWhenItIsFull) {
    KeySetCache cache;
    test::RandomValues random(3);
    for (int i = 0; i < 4000; ++i) {
        Dictionary map{{"common", i}, {"key" + std::to_string(random.below(1500)), random.text()}};
        map.set("x" + std::to_string(random.below(3)), Dictionary{{"y" + std::to_string(i % 700), 1}});
        const Bytes bytes = written(Value(map));
        EXPECT_EQ(CborReader(bytes, &cache).readDictionary(1), map);
    }
}

} // namespace
} // namespace tamblo
