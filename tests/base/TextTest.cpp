#include "base/Base64.h"
#include "base/Format.h"
#include "base/Rfc3339.h"
#include "base/TextBuffer.h"
#include "base/Utf8.h"
#include "tests/base/Hex.h"

#include <gtest/gtest.h>

#include <limits>
#include <sstream>
#include <string>
#include <vector>

namespace tamblo {

namespace colours {
enum class Colour { red };
void appendText(std::string& out, const Colour&) {
    out += "red";
}
} // namespace colours

namespace {

TEST(Format, PutsArgumentsInTheirPlaces) {
    EXPECT_EQ(formatted("nothing"), "nothing");
    EXPECT_EQ(formatted("{}{}", 1, "a"), "1a");
    EXPECT_EQ(formatted("a={} b={}, {{}", -5, true, std::string("{}")), "a=-5 b=1, {{}");
    EXPECT_EQ(formatted("{}/{}", std::numeric_limits<std::int64_t>::min(),
                        std::numeric_limits<std::uint64_t>::max()),
              "-9223372036854775808/18446744073709551615");
    EXPECT_EQ(formatted("{} {} {}", 1.5, 0.1F, -0.0), "1.500000 0.100000 -0.000000");
    EXPECT_EQ(formatted("{} {} {}", fixed(2.675, 1), fixed(2.5, 0), fixed(-0.125, 2)), "2.7 2 -0.12");
    EXPECT_EQ(formatted("{}", std::numeric_limits<double>::max()).size(), 309U + 7U);
    EXPECT_EQ(formatted("<{}>", colours::Colour::red), "<red>");
}

TEST(TextBuffer, GrowsAndGivesBack) {
    TextBuffer buffer;
    buffer.append("");
    EXPECT_TRUE(buffer.empty());
    std::string expected;
    for (int i = 0; i < 300; ++i) {
        buffer.append("0123456789");
        buffer.append('x');
        expected += "0123456789x";
    }
    EXPECT_EQ(buffer.view(), expected);
    buffer.dropFront(11);
    buffer.truncate(buffer.size() - 1);
    EXPECT_EQ(buffer.view(), std::string_view(expected).substr(11, expected.size() - 12));
    TextBuffer moved = std::move(buffer);
    EXPECT_EQ(moved.size(), expected.size() - 12);
    EXPECT_EQ(buffer.size(), 0U);
    moved.reset();
    EXPECT_EQ(moved.capacity(), 0U);
}

TEST(Utf8, TellsWhatIsWellFormed) {
    // The first and the last of every length, and their neighbours.
    const std::string wellFormed = "207f c280 dfbf e0a080 ed9fbf ee8080 efbfbf f0908080 f48fbfbf";
    const std::string malformed = "80 bf c080 c1bf c2 c241 c2c280 e09fbf e6b0 eda080 edbfbf f08fbfbf f09085 "
                                  "f4908080 f5808080 ff";
    for (const bool expected : {true, false}) {
        std::istringstream words(expected ? wellFormed : malformed);
        for (std::string word; words >> word;) {
            const auto bytes = test::fromHex(word);
            for (std::size_t before = 0; before < 17; ++before) {
                for (const char* behind : {"", "z", "zzzzzzzz"}) {
                    const std::string text(bytes.begin(), bytes.end());
                    EXPECT_EQ(isUtf8(std::string(before, 'a') + text + behind), expected)
                        << word << " behind " << before;
                }
            }
        }
    }
}

TEST(Base64, ReadsAndWritesTheExamplesOfTheStandard) {
    const std::pair<std::string, std::string> rows[] = {
        {"", ""},        {"f", "Zg=="},        {"fo", "Zm8="},
        {"foo", "Zm9v"}, {"foob", "Zm9vYg=="}, {"\xFB\xFF\xBF", "+/+/"}};
    for (const auto& [plain, text] : rows) {
        const std::vector<std::uint8_t> bytes(plain.begin(), plain.end());
        EXPECT_EQ(encodeBase64(bytes), text);
        EXPECT_EQ(decodeBase64(text), bytes);
    }
    for (const char* text : {"Z", "Zg", "Zg=", "Zg===", "=", "====", "Z===", "Zh==", "Zm9=", "Zm-_", "Zm9v\n",
                             " Zm9v", "Zg==Zg==", "Zm=v"}) {
        EXPECT_EQ(decodeBase64(text), std::nullopt) << text;
    }
}

TEST(Rfc3339, WritesTimes) {
    constexpr double infinity = std::numeric_limits<double>::infinity();
    const std::vector<std::pair<double, const char*>> rows{
        {0, "1970-01-01T00:00:00.000Z"},
        {-0.0, "1970-01-01T00:00:00.000Z"},
        {0.9996, "1970-01-01T00:00:01.000Z"},
        {59.99951, "1970-01-01T00:01:00.000Z"},
        {-0.25, "1969-12-31T23:59:59.750Z"},
        {-0.0001, "1970-01-01T00:00:00.000Z"},
        {1772366400.25, "2026-03-01T12:00:00.250Z"},
        {1709164800, "2024-02-29T00:00:00.000Z"},
        {951782399.9996, "2000-02-29T00:00:00.000Z"},
        {4107542400, "2100-03-01T00:00:00.000Z"},
        {-62167219200, "0000-01-01T00:00:00.000Z"},
        {-62167219201, nullptr},
        {253402300799.999, "9999-12-31T23:59:59.999Z"},
        {253402300799.9997, nullptr},
        {infinity, nullptr},
        {std::numeric_limits<double>::quiet_NaN(), nullptr},
        {1e300, nullptr}};
    for (const auto& [seconds, text] : rows) {
        EXPECT_EQ(formatRfc3339(seconds), text == nullptr ? std::nullopt : std::optional<std::string>(text))
            << seconds;
        EXPECT_EQ(formatRfc3339Date(seconds).value_or("none"),
                  text == nullptr ? "none" : std::string(text).substr(0, 10))
            << seconds;
    }
}

} // namespace
} // namespace tamblo
