#include "base/Cbor.h"
#include "base/JsonReader.h"
#include "base/NumberText.h"
#include "tests/base/AllocationCount.h"
#include "tests/base/Samples.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <algorithm>
#include <array>
#include <bit>
#include <charconv>
#include <cmath>
#include <iterator>
#include <random>
#include <set>
#include <sstream>
#include <string>
#include <tuple>
#include <variant>
#include <vector>

namespace tamblo {
namespace {

using nlohmann::json;
using test::fromHex;
using test::repeated;
using testing::AnyOf;
using testing::HasSubstr;
using Bytes = std::vector<std::uint8_t>;
using Outcome = std::variant<Value, CborError>;

/// Reads one item, with and without the memory of key sets, which must not make a difference.
Outcome read(std::span<const std::uint8_t> bytes, KeySetCache* known = nullptr) {
    KeySetCache fresh;
    CborReader plain(bytes);
    const auto value = plain.readValue();
    for (int round = 0; round < 2; ++round) {
        CborReader cached(bytes, known != nullptr ? known : &fresh);
        EXPECT_EQ(cached.readValue(), value);
        EXPECT_EQ(cached.error(), plain.error());
    }
    EXPECT_TRUE(value ? plain.atEnd() : plain.peek() == CborReader::Type::end);
    EXPECT_EQ(value.has_value(), plain.error() == CborError::none);
    return value ? Outcome(*value) : plain.error();
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

std::vector<std::string> wordsOf(const std::string& text) {
    std::istringstream stream(text);
    return {std::istream_iterator<std::string>(stream), {}};
}

/// A value in JSON; `f` stands behind a number of single precision, `t` behind the seconds of a date, `h`
/// behind the hexadecimal digits of a byte string.
Value valueNamed(const std::string& text) {
    switch (text.back()) {
    case 'f':
        return std::stof(text);
    case 't':
        return Value::date(std::stod(text));
    case 'h':
        return Value::data(fromHex(std::string_view(text).substr(0, text.size() - 1)));
    default:
        return std::get<Value>(readJson(text));
    }
}

TEST(Cbor, ReadsTheExamplesOfTheStandardAndFindsTheirTruncationAtEveryByte) {
    // RFC 8949, appendix A, and some more, without what an independent implementation writes in the same way:
    // bytes and their value.
    const auto words = wordsOf(R"(
        f90000 0.0f  f98000 -0.0f  f93c00 1.0f  f97bff 65504.0f  f9c400 -4.0f  f90001 5.960464477539063e-8f
        f90400 0.00006103515625f  fa47c35000 100000.0f  fa7f7fffff 3.4028234663852886e+38f  fa3dcccccd 0.1f
        f97c00 inff  f9fc00 -inff  fa7f800000 inff  fa7fc00000 nanf  fb3ff0000000000000 1.0
        c1fb41d452d9ec200000 1363896240.5t  c1f93e00 1.5t  c120 -1t
        4401020304 01020304h  5f42010243030405ff 0102030405h  5fff h
        64f0908591 "\ud800\udd51"  7f657374726561646d696e67ff "streaming"
        9fff []  9f018202039f0405ffff [1,[2,3],[4,5]]  83019f0203ff820405 [1,[2,3],[4,5]]
        bf61610161629f0203ffff {"a":1,"b":[2,3]}  826161bf61626163ff ["a",{"b":"c"}]
        bf6346756ef563416d7421ff {"Fun":true,"Amt":-2}  bf7f616161626163ff01ff {"abc":1}
        1800 0  190000 0  1a00000000 0  3800 -1  1b0000000000000001 1  5900020102 0102h
        5a000000020102 0102h  7b000000000000000178 "x"  bf7f616162c3a9ff9ff5a1616280ffff {"aé":[true,{"b":[]}]})");
    for (std::size_t i = 0; i + 1 < words.size(); i += 2) {
        SCOPED_TRACE(words[i]);
        const Value expected = valueNamed(words[i + 1]);
        const Bytes bytes = fromHex(words[i]);
        EXPECT_TRUE(skips(bytes));
        for (const Outcome& outcome : {read(bytes), read(written(expected))}) {
            ASSERT_EQ(outcome, Outcome(expected));
            EXPECT_EQ(std::get<Value>(outcome).kind(), expected.kind());
        }
        for (std::size_t length = 0; length < bytes.size(); ++length) {
            // A copy of its own length, so that a memory checker sees a step beyond it.
            const Bytes part(bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(length));
            EXPECT_EQ(read(part), Outcome(CborError::truncated)) << length;
            EXPECT_FALSE(skips(part)) << length;
        }
    }
    EXPECT_EQ(written(Array{0.1F, 1.0, Dictionary{{"b", 24}, {"a", -257}}}),
              fromHex("83 fa3dcccccd fb3ff0000000000000 a2 6161 390100 6162 1818"));
}

TEST(Cbor, RefusesWhatIsNoValueAndSkipsWhatIsWellFormed) {
    const std::vector<std::pair<CborError, const char*>> table{
        {CborError::nullValue, "f6 f7 a16161f6 81f7 c1f6"},
        {CborError::unsupportedTag,
         "c249010000000000000000 c349010000000000000000 d74401020304 d818456449455446"},
        {CborError::unsupportedTag, "c074323031332d30332d32315432303a30343a30305a c16131 c1c101 81d9d9f701"},
        {CborError::unsupportedSimple, "f0 f8ff e0 f3 f820"},
        {CborError::keyNotText, "a201020304 a1416101 bff500ff"},
        {CborError::duplicateKey, "a2616101616102 a3616201616102616203 bf6161016161f5ff a27f6161ff01616102"},
        {CborError::duplicateKey, "8181a2616101616102"},
        // Each chunk of a text stands for itself (RFC 8949, section 3.2.3).
        {CborError::notUtf8, "61ff 62c080 63eda080 70616161616161616161616161616161ff a161ff01 7f61c361bcff"},
        {CborError::integerOutOfRange, "3bffffffffffffffff 3b8000000000000000"},
        {CborError::malformed, "1c 1d 1e 3c 3e 5c 7d 9e bc dd fc fd fe f800 f818 f81f 1f 3f df ff c1ff"},
        {CborError::malformed, "5f00ff 5f21ff 5f6100ff 5f80ff 5fa0ff 5fc000ff 5fe0ff 7f4100ff 5f5f4100ffff"},
        {CborError::malformed, "7f7f6100ffff 81ff 8200ff a1ff a26161ff a26161016162ff 9f81ff bf6161ff"},
        {CborError::truncated, "fa0000 fb000000 9a01ff00 5affffffff00 5bffffffffffffffff010203 7affffffff00"},
        {CborError::truncated, "7b7fffffffffffffff010203 8200 a1 c1 d8 f8"}};
    for (const auto& [error, row] : table) {
        for (const std::string& hex : wordsOf(row)) {
            const bool isWellFormed = error != CborError::malformed && error != CborError::truncated;
            EXPECT_EQ(read(fromHex(hex)), Outcome(error)) << hex;
            EXPECT_EQ(skips(fromHex(hex)), isWellFormed) << hex;
        }
    }
}

TEST(Cbor, AllocatesNothingFromADeclaredCount) {
    KeySetCache cache;
    for (const std::string& hex :
         wordsOf("5a40000000 5bffffffffffffffff 7a40000000616101 7b8000000000000000 9a40000000616101 "
                 "9b1000000000000000 9bffffffffffffffff0000 ba40000000 bb8000000000000000616101 "
                 "bb1000000000000000 bbffffffffffffffff616101")) {
        const Bytes bytes = fromHex(hex);
        const auto spent =
            test::allocationsOf([&] { EXPECT_EQ(CborReader(bytes, &cache).readValue(), std::nullopt); });
        EXPECT_LT(spent.bytes, 20'000U) << hex;
        EXPECT_FALSE(skips(bytes)) << hex;
    }
}

TEST(Cbor, NestsToItsDepth) {
    const int most = CborReader::kMaximumDepth;
    for (const auto& [open, close] : std::vector<std::pair<std::string, std::string>>{
             {"81", ""}, {"9f", "ff"}, {"a16161", ""}, {"bf6161", "ff"}}) {
        const auto nested = [&](int depth) {
            return fromHex(repeated(open, depth) + "01" + repeated(close, depth));
        };
        EXPECT_TRUE(std::holds_alternative<Value>(read(nested(most)))) << open;
        EXPECT_EQ(read(nested(most + 1)), Outcome(CborError::tooDeep)) << open;
        EXPECT_EQ(read(nested(200'000)), Outcome(CborError::tooDeep)) << open;
        EXPECT_TRUE(skips(nested(200'000))) << open;
    }
    const Bytes tags = fromHex(repeated("c1", 200'000) + "01");
    EXPECT_EQ(read(tags), Outcome(CborError::unsupportedTag));
    EXPECT_TRUE(skips(tags));
}

TEST(KeySetCache, MakesNoDifferenceButSharesKeySets) {
    KeySetCache cache;
    test::RandomJson random(3);
    // Few keys make shapes that begin like a remembered one and then differ, end early, go on, or name a key
    // twice; many keys fill the memory.
    for (int i = 0; i < 6000; ++i) {
        const std::size_t entries = random.below(6);
        Bytes bytes{static_cast<std::uint8_t>(0xA0 + entries)};
        std::set<std::string> keys;
        for (std::size_t entry = 0; entry < entries; ++entry) {
            const std::string number = std::to_string(random.below(1500));
            const std::string key = random.below(8) == 0 ? "equal ends " + number + " equal ends"
                                                         : std::string(1, "abcdefgh"[random.below(8)]);
            std::ranges::copy(written(Value(key)), std::back_inserter(bytes));
            const std::string text = "text of the kind " + std::to_string(random.below(3));
            const Value value = random.below(4) == 0 ? Value(text) : valueNamed(random.value(1));
            std::ranges::copy(written(value), std::back_inserter(bytes));
            keys.insert(key);
        }
        const bool namesAKeyTwice = keys.size() < entries;
        const Outcome outcome = read(bytes, &cache);
        ASSERT_EQ(outcome == Outcome(CborError::duplicateKey), namesAKeyTwice);
        // With more behind it, values are taken several bytes at a time.
        bytes.resize(bytes.size() + 40);
        const CborLimits limits{.entries = 2 + random.below(9),
                                .keyBytes = 1 + random.below(60),
                                .bytesOfKeys = 1 + random.below(120),
                                .decodedBytes = 100 + random.below(800)};
        CborReader plain(bytes, nullptr, limits);
        CborReader cached(bytes, &cache, limits);
        ASSERT_EQ(cached.readValue(), plain.readValue());
        ASSERT_EQ(cached.error(), plain.error());
        ASSERT_TRUE(cached.error() != CborError::none || cached.decodedBytes() == plain.decodedBytes());
    }
    const Bytes one = fromHex("a3616101616202616303");
    const Bytes other = fromHex("a3616105616206616307");
    EXPECT_EQ(&CborReader(one, &cache).readDictionary(1)->keys(),
              &CborReader(other, &cache).readDictionary(1)->keys());
}

TEST(RecentTexts, AreSharedAndNeverTakenForOthers) {
    KeySetCache cache;
    // Some take each other's places, some differ in the middle only, some are too short or too long.
    for (int i = 0; i < 6000; ++i) {
        const std::string number = std::to_string(i % 2000);
        for (const std::string& text :
             {"a text with " + number, "equal ends " + number + " equal ends", std::string(i % 120, 'x')}) {
            const Bytes bytes = written(Value(text));
            ASSERT_EQ(CborReader(bytes, &cache).readValue(), Value(text));
            const auto again = test::allocationsOf(
                [&] { ASSERT_EQ(CborReader(bytes, &cache).readValue()->stringValue(), text); });
            ASSERT_EQ(again.blocks, text.size() > 96 ? 1U : 0U);
        }
    }
}

/// An array is refused for the same reason when it is read element by element.
void expectSameByElements(const std::string& element) {
    const std::string text = "[" + element + "]";
    JsonReader reader(text);
    while (reader.readElement() != nullptr) {
    }
    const auto whole = readJson(text);
    const auto* const error = std::get_if<JsonError>(&whole);
    ASSERT_EQ(reader.error().has_value(), error != nullptr) << text;
    if (error != nullptr) {
        EXPECT_EQ(reader.error()->message, error->message) << text;
        EXPECT_EQ(reader.error()->column, error->column) << text;
    }
}

Value readText(const std::string& text) {
    const auto outcome = readJson(text);
    const auto* const value = std::get_if<Value>(&outcome);
    EXPECT_TRUE(value != nullptr) << text;
    return value != nullptr ? *value : Value();
}

std::string prettyText(std::string_view key, const Dictionary& dictionary) {
    TextBuffer out;
    out.append("before");
    const auto failure = appendPrettyJson(out, key, dictionary);
    EXPECT_EQ(out.view() == "before", failure.has_value());
    return failure ? *failure : std::string(out.view().substr(6));
}

TEST(JsonWriter, GivesEveryKindItsForm) {
    const std::vector<std::uint8_t> bytes{0, 0xFF, 0x10, 0x80};
    const std::vector<std::pair<Value, std::string>> rows{
        {-0.0, "-0.0"},
        {Value::date(1772366400.25), "\"2026-03-01T12:00:00.250Z\""},
        {Value::date(1e300), "null"},
        {Value::data(bytes), "\"AP8QgA==\""}};
    for (const auto& [value, text] : rows) {
        EXPECT_EQ(jsonText(value), text);
    }
    for (std::string everyByte; everyByte.size() < 0x7F; everyByte += static_cast<char>(everyByte.size())) {
        EXPECT_EQ(jsonText(Value(everyByte)), json(everyByte).dump());
    }
}

TEST(JsonWriter, NumbersAreTheShortestThatReadBackTheSame) {
    std::mt19937_64 random(11); // NOLINT: the same numbers at every run
    const auto expectSame = [](auto number) {
        const std::string text = jsonText(Value(number));
        if (!std::isfinite(number)) {
            EXPECT_EQ(text, "null");
        } else if (number == std::trunc(number)) {
            EXPECT_EQ(parseNumber<decltype(number)>(text), number);
            EXPECT_NE(text.find_first_of(".e"), text.npos) << text;
        } else {
            std::array<char, 32> shortest{};
            std::to_chars(shortest.data(), shortest.data() + shortest.size(), number);
            EXPECT_EQ(text, shortest.data());
        }
    };
    for (int i = 0; i < 20000; ++i) {
        const auto bits = static_cast<std::uint32_t>(random());
        expectSame(std::bit_cast<float>(bits));
        expectSame(static_cast<float>(bits >> (bits % 32)));
        expectSame(std::bit_cast<double>(random()));
        expectSame(std::ldexp(static_cast<double>(random() >> 11U), static_cast<int>(random() % 120) - 90));
        const double few = static_cast<double>(random() % 1'000'000'000) / std::pow(10.0, random() % 12);
        expectSame(few);
        expectSame(-std::nextafter(few, 0.0));
    }
}

TEST(JsonReader, ReadsWhatIsJson) {
    for (const std::string& text :
         {std::string(" \t\r\n1 \n"), std::string("[-0,-0.0,9223372036854775808,18446744073709551616]"),
          std::string("[-9223372036854775809,123456789012345678901234567890]"),
          std::string("[1E-2,1.5e+3,1e-400,-1e-999999999999999999999,4.9e-324]"),
          "0.000" + std::string(400, '0') + "1", "1" + std::string(400, '0') + "e-400",
          "0." + std::string(400, '0') + "1e401",
          std::string(R"("\"\\\/\b\f\n\r\t\u0041\u00e9\u6C34\ud800\udd51\udbff\udfff\u0000")"),
          repeated("[", 32) + repeated("]", 32)}) {
        EXPECT_EQ(json::parse(jsonText(readText(text))).dump(), json::parse(text).dump()) << text;
    }
    EXPECT_EQ(readText(R"([ null , {"b":1,"a":[{}],"n":null},null ])"),
              Value(Array{Dictionary{{"a", Array{Dictionary{}}}, {"b", 1}}}));
}

TEST(JsonReader, SaysWhatIsWrongAndWhere) {
    const struct {
        std::string text;
        std::size_t line, column;
        const char* says;
    } rows[] = {
        {"\xEF\xBB\xBF{}", 1, 1, "the byte 239"},
        {"[1e309]", 1, 2, "too large"},
        {"{\"a\":1,\n \"\xC3\xA9\":2, \"a\":3}", 2, 9, "\"a\" stands here a second time"},
        {R"({"b":0,"\u0061":0,"c":{"a":null,"\u0061":1},"a":0})", 1, 33, "\"a\" stands here a second time"},
        {std::string("\"a\0\"", 4), 1, 3, "escaped"},
        {R"("\u12g4")", 1, 4, "hexadecimal"},
        {R"("\ud800\ud800")", 1, 2, "surrogate"},
        {"[\"\xC0\x80\"]", 1, 2, "UTF-8"},
        {repeated("[", 33) + repeated("]", 33), 1, 33, "deeper than 32"},
        {repeated("{\"\":", 200'000), 1, 129, "deeper than 32"},
    };
    for (const auto& row : rows) {
        const auto outcome = readJson(row.text);
        const auto* const error = std::get_if<JsonError>(&outcome);
        ASSERT_TRUE(error != nullptr) << row.text;
        EXPECT_EQ(std::tie(error->line, error->column), std::tie(row.line, row.column)) << row.text;
        EXPECT_THAT(error->message, HasSubstr(row.says)) << row.text;
        expectSameByElements(row.text);
    }
    EXPECT_EQ(std::get<JsonError>(readJson("{\"a\":\n[1, null]}", {.refuseNull = true})).column, 5U);
    for (const auto& [text, says] :
         {std::pair("{\"a\":1}", "not an array"), std::pair("{\"a\":1", "a comma or '}'")}) {
        JsonReader reader(text);
        EXPECT_EQ(reader.readElement(), nullptr);
        EXPECT_THAT(reader.error().value().message, HasSubstr(says)) << text;
    }
    JsonReader reader("[1] 2");
    EXPECT_TRUE(reader.readElement() != nullptr && reader.readElement() == nullptr && reader.error());
}

TEST(Json, IsLaidOutForPeople) {
    const std::string text = R"({"list":[],"map":{},"nested":[1,{"key":[[-2,true],"text"]}],"deep":)" +
                             repeated("[", 30) + repeated("]", 30) + "}";
    const json theirs = json::parse(text);
    const auto ours = readText(text);
    EXPECT_EQ(jsonText(ours), theirs.dump());
    EXPECT_EQ(prettyText("a \"key\"", ours.dictionaryValue()), (json{{"a \"key\"", theirs}}.dump(2)));
    EXPECT_EQ(prettyText("K", {{"list", Array{1, Dictionary{{"a/b~", Value(std::nan(""))}}}}}),
              "a number that is not finite has no JSON form, at /K/list/1/a~1b~0");
    EXPECT_EQ(prettyText("K", {{"", Array{Value::date(1)}}}), "a date has no JSON form, at /K//0");
}

TEST(Codecs, AgreeWithAnIndependentImplementation) {
    test::RandomJson random(5);
    for (int i = 0; i < 3000; ++i) {
        const std::string text = random.object(5);
        SCOPED_TRACE(text);
        const json theirs = json::parse(text);
        const auto ours = readText(theirs.dump(i % 3, ' ', i % 2 == 0));
        EXPECT_EQ(json::parse(jsonText(ours)), theirs);
        EXPECT_EQ(json::parse(prettyText("key", ours.dictionaryValue()))["key"], theirs);

        TextBuffer bytes;
        CborWriter(bytes).value(ours);
        EXPECT_EQ(json::from_cbor(bytes.bytes()), theirs);
        EXPECT_EQ(CborReader(json::to_cbor(theirs)).readValue(), ours);
    }
}

TEST(Json, AcceptsNoMoreThanAnIndependentImplementation) {
    test::RandomJson random(9);
    const std::string pieces = "{}[],:\"\\u0e1.-+tfn \n\xC3\xA9\x01";
    for (int i = 0; i < 20000; ++i) {
        std::string text = random.value(3);
        for (std::size_t changes = random.below(3); changes > 0; --changes) {
            const std::size_t at = random.below(text.size() + 1);
            if (random.below(2) == 0) {
                text.insert(at, 1, pieces[random.below(pieces.size())]);
            } else {
                text.erase(at, 1);
            }
        }
        SCOPED_TRACE(text);
        expectSameByElements(text);
        const auto ours = readJson(text);
        const json theirs = json::parse(text, nullptr, false);
        if (const auto* value = std::get_if<Value>(&ours)) {
            EXPECT_EQ(json::parse(jsonText(*value)).dump(), theirs.dump());
        } else if (!theirs.is_discarded()) {
            // Theirs lets a null and a key that stands twice pass; ours does not.
            EXPECT_THAT(std::get<JsonError>(ours).message,
                        AnyOf(HasSubstr("second time"), HasSubstr("null")));
        }
    }
}

} // namespace
} // namespace tamblo
