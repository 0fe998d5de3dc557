#include "base/Cbor.h"
#include "base/JsonReader.h"
#include "base/NumberText.h"
#include "tests/base/Samples.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <array>
#include <bit>
#include <charconv>
#include <cmath>
#include <limits>
#include <random>
#include <string>
#include <tuple>
#include <vector>

namespace tamblo {
namespace {

using nlohmann::json;
using test::repeated;
using testing::AnyOf;
using testing::HasSubstr;

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

Value read(const std::string& text) {
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
        {1e21, "1e+21"},
        {9007199254740992.0, "9007199254740992.0"},
        {16777216.0F, "16777216.0"},
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

TEST(JsonWriter, SaysForPeopleWhatHasNoFormAndWhere) {
    const std::pair<Dictionary, const char*> rows[] = {
        {{{"a", Value::data({})}}, "a byte string has no JSON form, at /K_1/a"},
        {{{"list", Array{1, Dictionary{{"a/b~", -std::numeric_limits<float>::infinity()}}}}},
         "a number that is not finite has no JSON form, at /K_1/list/1/a~1b~0"},
        {{{"", Dictionary{{"d", Array{Value(Array{Value::date(1)})}}}}},
         "a date has no JSON form, at /K_1//d/0/0"},
    };
    for (const auto& [payload, says] : rows) {
        EXPECT_EQ(prettyText("K_1", payload), says);
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
        EXPECT_EQ(json::parse(jsonText(read(text))).dump(), json::parse(text).dump()) << text;
    }
    EXPECT_EQ(read(R"([ null , {"b":1,"a":[{}],"n":null},null ])"),
              Value(Array{Dictionary{{"a", Array{Dictionary{}}}, {"b", 1}}}));
}

TEST(JsonReader, SaysWhatIsWrongAndWhere) {
    const struct {
        std::string text;
        std::size_t line, column;
        const char* says;
    } rows[] = {
        {"", 1, 1, "the end of the text"},
        {"null", 1, 1, "null"},
        {"\xEF\xBB\xBF{}", 1, 1, "the byte 239"},
        {"[1e309]", 1, 2, "too large"},
        {"-1e99999999999999999999", 1, 1, "too large"},
        {"{\"a\"}", 1, 5, "colon"},
        {"{\"a\":1,\n \"\xC3\xA9\":2, \"a\":3}", 2, 9, "\"a\" stands here a second time"},
        {R"({"b":0,"\u0061":0,"c":{"a":null,"\u0061":1},"a":0})", 1, 33, "\"a\" stands here a second time"},
        {"\"abc", 1, 1, "does not end"},
        {std::string("\"a\0\"", 4), 1, 3, "escaped"},
        {R"("\x41")", 1, 2, "no escape of 'x'"},
        {R"("\u12g4")", 1, 4, "hexadecimal"},
        {R"("\ud800\ud800")", 1, 2, "surrogate"},
        {R"("\udbff\ue000")", 1, 2, "surrogate"},
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
    const auto ours = read(text);
    EXPECT_EQ(jsonText(ours), theirs.dump());
    EXPECT_EQ(prettyText("a \"key\"", ours.dictionaryValue()), (json{{"a \"key\"", theirs}}.dump(2)));
}

TEST(Codecs, AgreeWithAnIndependentImplementation) {
    test::RandomJson random(5);
    for (int i = 0; i < 3000; ++i) {
        const std::string text = random.object(5);
        SCOPED_TRACE(text);
        const json theirs = json::parse(text);
        const auto ours = read(theirs.dump(i % 3, ' ', i % 2 == 0));
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
