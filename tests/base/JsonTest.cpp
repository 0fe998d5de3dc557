#include "base/JsonReader.h"
#include "tests/base/Samples.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <limits>
#include <random>
#include <string>
#include <tuple>
#include <vector>

namespace tamblo {
namespace {

using test::repeated;

constexpr double kInfinity = std::numeric_limits<double>::infinity();

Value valueOf(const JsonItem& item) {
    Array elements;
    Dictionary members;
    for (const JsonItem* inner = item.first(); inner != item.end(); inner = inner->next()) {
        if (inner->kind != JsonItem::Kind::null) {
            elements.push_back(valueOf(*inner));
            members.set(inner->key, elements.back());
        }
        if (item.kind == JsonItem::Kind::object) {
            EXPECT_EQ(item.find(inner->key), inner->kind != JsonItem::Kind::null ? inner : nullptr);
        }
    }
    return item.kind == JsonItem::Kind::text     ? Value(item.text)
           : item.kind == JsonItem::Kind::array  ? Value(elements)
           : item.kind == JsonItem::Kind::object ? Value(members)
                                                 : item.scalar;
}

/// Reading an array element by element finds what reading it as a value does, its errors included.
void expectSameByElements(const std::string& element) {
    const std::string text = "[" + element + "]";
    const auto whole = readJson(text);
    JsonReader reader(text);
    Array found;
    while (const JsonItem* item = reader.readElement()) {
        if (item->kind != JsonItem::Kind::null) {
            found.push_back(valueOf(*item));
        }
    }
    EXPECT_EQ(reader.readElement(), nullptr);
    ASSERT_EQ(reader.error().has_value(), std::holds_alternative<JsonError>(whole)) << text;
    if (const auto& error = reader.error()) {
        const auto& expected = std::get<JsonError>(whole);
        EXPECT_EQ(std::tie(error->message, error->column), std::tie(expected.message, expected.column))
            << text;
    } else {
        EXPECT_EQ(Value(found), std::get<Value>(whole)) << text;
    }
}

std::string prettyText(std::string_view key, const Dictionary& dictionary) {
    TextBuffer out;
    out.append("before");
    const auto failure = appendPrettyJson(out, key, dictionary);
    EXPECT_EQ(out.view() == "before", failure.has_value());
    return failure ? *failure : std::string(out.view().substr(6));
}

bool hasFloat(const nlohmann::json& json) {
    return json.is_structured() ? std::any_of(json.begin(), json.end(), hasFloat) : json.is_number_float();
}

TEST(JsonWriter, GivesEveryKindItsForm) {
    const std::vector<std::uint8_t> bytes{0, 0xFF, 0x10, 0x80};
    const std::vector<std::pair<Value, std::string>> rows{
        {-0.0, "-0.0"},
        {1e21, "1e+21"},
        {9007199254740992.0, "9007199254740992.0"},
        {16777216.0F, "16777216.0"},
        {-std::numeric_limits<float>::infinity(), "null"},
        {std::numeric_limits<double>::quiet_NaN(), "null"},
        {Value::date(1772366400.25), "\"2026-03-01T12:00:00.250Z\""},
        {Value::date(kInfinity), "null"},
        {Value::data(bytes), "\"AP8QgA==\""}};
    for (const auto& [value, text] : rows) {
        EXPECT_EQ(jsonText(value), text);
    }
    std::string everyByte;
    for (char byte = 0; byte < 0x7F; ++byte) {
        everyByte += byte;
        EXPECT_EQ(jsonText(Value(everyByte)), nlohmann::json(everyByte).dump());
    }
}

TEST(JsonWriter, NumbersAreTheShortestThatReadBackTheSame) {
    std::mt19937_64 random(11); // NOLINT: the same numbers at every run
    const auto expectSame = [](auto number) {
        const std::string text = jsonText(Value(number));
        auto back = number;
        const auto result = std::from_chars(text.data(), text.data() + text.size(), back);
        EXPECT_TRUE(std::isfinite(number) ? back == number && *result.ptr == '\0' : text == "null") << text;
        EXPECT_EQ(std::isfinite(number), text.find_first_of(".e") != text.npos) << text;
        std::array<char, 32> shortest{};
        const auto end = std::to_chars(shortest.data(), shortest.data() + shortest.size(), number).ptr;
        if (std::isfinite(number) && number != std::trunc(number)) {
            EXPECT_EQ(text, std::string_view(shortest.data(), end));
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
    const std::vector<std::uint8_t> bytes{1};
    const std::pair<Dictionary, const char*> rows[] = {
        {{{"a", Value::data(bytes)}}, "a byte string has no JSON form, at /K_1/a"},
        {{{"n", std::numeric_limits<double>::quiet_NaN()}},
         "a number that is not finite has no JSON form, at /K_1/n"},
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
         {std::string("-0"), std::string(" \t\r\n1 \n"), std::string("9223372036854775808"),
          std::string("18446744073709551616"), std::string("-9223372036854775809"), std::string("-0.0"),
          std::string("[1E-2,1.5e+3,1e-400,-1e-999999999999999999999,4.9e-324]"),
          std::string("123456789012345678901234567890"), "0.000" + std::string(400, '0') + "1",
          "1" + std::string(400, '0') + "e-400", "0." + std::string(400, '0') + "1e401",
          std::string(R"("\"\\\/\b\f\n\r\t\u0041\u00e9\u6C34\ud800\udd51\udbff\udfff\u0000")"),
          repeated("[", 32) + repeated("]", 32)}) {
        const auto outcome = readJson(text);
        ASSERT_TRUE(std::holds_alternative<Value>(outcome))
            << text << ": " << std::get<JsonError>(outcome).message;
        EXPECT_EQ(test::toNlohmann(std::get<Value>(outcome)).dump(), nlohmann::json::parse(text).dump());
    }
    EXPECT_EQ(std::get<Value>(readJson(R"([ null , {"b":1,"a":[{}],"n":null},null ])")),
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
        {"01", 1, 2, "begin with 0"},
        {"1e+", 1, 4, "digit"},
        {"[1e309]", 1, 2, "too large"},
        {"-1e99999999999999999999", 1, 1, "too large"},
        {"[1,]", 1, 4, "']'"},
        {"{\"a\"}", 1, 5, "colon"},
        {"{\"a\":1,}", 1, 8, "key in quotes"},
        {"{\"a\":1,\n \"\xC3\xA9\":2, \"a\":3}", 2, 9, "\"a\" stands here a second time"},
        {R"({"b":0,"\u0061":0,"c":{"a":null,"\u0061":1},"a":0})", 1, 33, "\"a\" stands here a second time"},
        {"\"abc", 1, 1, "does not end"},
        {"\"a\nb\"", 1, 3, "escaped"},
        {std::string("\"\0\"", 3), 1, 2, "escaped"},
        {R"("\x41")", 1, 2, "no escape of 'x'"},
        {R"("\u12g4")", 1, 4, "hexadecimal"},
        {R"("\ud800\ud800")", 1, 2, "surrogate"},
        {R"("\ud800\u0041")", 1, 2, "surrogate"},
        {R"("\udbff\ue000")", 1, 2, "surrogate"},
        {"[\"\xC0\x80\"]", 1, 2, "UTF-8"},
        {repeated("[", 33) + repeated("]", 33), 1, 33, "deeper than 32"},
        {repeated("{\"\":", 200'000), 1, 129, "deeper than 32"},
    };
    for (const auto& row : rows) {
        const auto outcome = readJson(row.text);
        ASSERT_TRUE(std::holds_alternative<JsonError>(outcome)) << row.text;
        const auto& error = std::get<JsonError>(outcome);
        EXPECT_EQ(std::tie(error.line, error.column), std::tie(row.line, row.column)) << row.text;
        EXPECT_NE(error.message.find(row.says), std::string::npos) << row.text << ": " << error.message;
        expectSameByElements(row.text);
    }
    const auto refused = readJson("{\"a\":\n[1, null]}", {.refuseNull = true});
    EXPECT_EQ(std::get<JsonError>(refused).line, 2U);
    EXPECT_EQ(std::get<JsonError>(refused).column, 5U);
    for (const auto& [text, says] :
         {std::pair("{\"a\":1}", "not an array"), std::pair("{\"a\":1", "a comma or '}'"),
          std::pair("[1] 2", "behind the end")}) {
        JsonReader reader(text);
        while (reader.readElement() != nullptr) {
        }
        ASSERT_TRUE(reader.error()) << text;
        EXPECT_NE(reader.error()->message.find(says), std::string::npos) << reader.error()->message;
    }
}

TEST(Json, AgreesWithAnIndependentImplementation) {
    test::RandomValues random(5);
    Value nested = Array{};
    for (int level = 1; level < 40; ++level) {
        nested = Value(Array{std::move(nested)});
    }
    EXPECT_EQ(prettyText("deep", {{"", nested}}),
              (nlohmann::json{{"deep", {{"", test::toNlohmann(nested)}}}}.dump(2)));
    int laidOutAlike = 0;
    for (int i = 0; i < 2000; ++i) {
        const Value value = random.value(4, true);
        const nlohmann::json theirs = test::toNlohmann(value);
        EXPECT_EQ(nlohmann::json::parse(jsonText(value)), theirs) << jsonText(value);
        for (const int indent : {-1, 2}) {
            const auto ours = readJson(theirs.dump(indent, ' ', indent > 0));
            ASSERT_TRUE(std::holds_alternative<Value>(ours)) << theirs;
            EXPECT_EQ(test::toNlohmann(std::get<Value>(ours)), theirs);
        }

        const std::string key = random.text();
        const Dictionary dictionary = random.dictionary(3, true);
        const std::string pretty = prettyText(key, dictionary);
        const nlohmann::json expected{{key, test::toNlohmann(Value(dictionary))}};
        ASSERT_EQ(nlohmann::json::parse(pretty, nullptr, false), expected) << pretty;
        if (!hasFloat(expected)) {
            ++laidOutAlike;
            EXPECT_EQ(pretty, expected.dump(2));
            EXPECT_EQ(jsonText(Value(dictionary)), expected[key].dump());
        }
    }
    EXPECT_GT(laidOutAlike, 200);
}

TEST(Json, AcceptsNoMoreThanAnIndependentImplementation) {
    test::RandomValues random(9);
    const std::string pieces = "{}[],:\"\\u0e1.-+tfn \n\xC3\xA9\x01";
    for (int i = 0; i < 20000; ++i) {
        std::string text = jsonText(random.value(3, true));
        for (std::size_t changes = random.below(3); changes > 0; --changes) {
            const std::size_t at = random.below(text.size() + 1);
            if (random.below(2) == 0) {
                text.insert(at, 1, pieces[random.below(pieces.size())]);
            } else {
                text.erase(at, 1);
            }
        }
        expectSameByElements(text);
        // Theirs lets a null and a key that stands twice pass; ours does not.
        const auto ours = readJson(text);
        const bool isTheirs = nlohmann::json::accept(text);
        EXPECT_TRUE(isTheirs || std::holds_alternative<JsonError>(ours)) << text;
        if (const auto* error = std::get_if<JsonError>(&ours); error != nullptr && isTheirs) {
            EXPECT_TRUE(error->message.find("second time") != std::string::npos ||
                        error->message.find("null") != std::string::npos)
                << text << ": " << error->message;
        } else if (error == nullptr && isTheirs) {
            EXPECT_EQ(test::toNlohmann(std::get<Value>(ours)).dump(), nlohmann::json::parse(text).dump());
        }
    }
}

} // namespace
} // namespace tamblo
