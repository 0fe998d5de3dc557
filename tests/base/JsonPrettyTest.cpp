#include "base/Json.h"
#include "tests/base/RandomValues.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <limits>
#include <string>
#include <vector>

namespace tamblo {
namespace {

std::string prettyText(std::string_view key, const Dictionary& dictionary) {
    TextBuffer out;
    const auto failure = appendPrettyJson(out, key, dictionary);
    return failure ? *failure : std::string(out.view());
}

bool hasFloat(const nlohmann::json& json) {
    if (json.is_structured()) {
        return std::any_of(json.begin(), json.end(), hasFloat);
    }
    return json.is_number_float();
}

TEST(JsonPretty, IsLaidOutForPeople) {
    EXPECT_EQ(prettyText("k", {}), "{\n  \"k\": {}\n}");
    EXPECT_EQ(prettyText("a \"b\"\n", {{"z", 1.0},
                                       {"list", Array{1, Array{}, Dictionary{{"x", 0.1F}}, "t\t"}},
                                       {"inner", Dictionary{{"b", true}, {"a", Dictionary{}}}}}),
              R"({
  "a \"b\"\n": {
    "inner": {
      "a": {},
      "b": true
    },
    "list": [
      1,
      [],
      {
        "x": 0.1
      },
      "t\t"
    ],
    "z": 1.0
  }
})");
    // Deeper than any message: every level is indented.
    Value deep = Array{};
    for (int level = 0; level < 40; ++level) {
        deep = Value(Array{std::move(deep)});
    }
    const std::string text = prettyText("k", {{"deep", deep}});
    EXPECT_NE(text.find("\n" + std::string(84, ' ') + "[]\n" + std::string(82, ' ') + "]\n"),
              std::string::npos)
        << text;
}

TEST(JsonPretty, ReadsAsAnIndependentImplementationDoes) {
    test::RandomValues random(5);
    int compared = 0;
    for (int i = 0; i < 2000; ++i) {
        const std::string key = random.text();
        const Dictionary dictionary = random.dictionary(3, true);
        const std::string text = prettyText(key, dictionary);
        const nlohmann::json expected{{key, test::toNlohmann(Value(dictionary))}};
        ASSERT_EQ(nlohmann::json::parse(text, nullptr, false), expected) << text;
        if (!hasFloat(expected)) {
            ++compared;
            EXPECT_EQ(text, expected.dump(2));
        }
    }
    EXPECT_GT(compared, 200);
}

TEST(JsonPretty, SaysWhatHasNoFormAndWhere) {
    const std::vector<std::uint8_t> bytes{1};
    const struct {
        Dictionary payload;
        const char* says;
    } cases[] = {
        {{{"a", Value::data(bytes)}}, "a byte string has no JSON form, at /K_1/a"},
        {{{"n", std::numeric_limits<double>::quiet_NaN()}},
         "a number that is not finite has no JSON form, at /K_1/n"},
        {{{"list", Array{1, Dictionary{{"a/b~", -std::numeric_limits<float>::infinity()}}}}},
         "a number that is not finite has no JSON form, at /K_1/list/1/a~1b~0"},
        {{{"", Dictionary{{"d", Array{Array{Value::date(1)}}}}}}, "a date has no JSON form, at /K_1//d/0/0"},
    };
    for (const auto& c : cases) {
        TextBuffer out;
        out.append("before");
        EXPECT_EQ(appendPrettyJson(out, "K_1", c.payload), c.says);
        EXPECT_EQ(out.view(), "before");
    }
}

} // namespace
} // namespace tamblo
