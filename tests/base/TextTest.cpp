#include "base/Base64.h"
#include "base/Format.h"
#include "base/Rfc3339.h"
#include "base/Utf8.h"
#include "tests/base/Samples.h"

#include <gtest/gtest.h>

#include <limits>
#include <sstream>
#include <string>
#include <vector>

namespace tamblo {
namespace {

TEST(Format, PutsArgumentsInTheirPlaces) {
    EXPECT_EQ(formatted("a={}{}{}, {{}", -5, true, "b", std::string("{}")), "a=-51b, {{}");
    EXPECT_EQ(formatted("{} {}", std::numeric_limits<std::int64_t>::min(), ~0ULL),
              "-9223372036854775808 18446744073709551615");
    EXPECT_EQ(formatted("{} {} {}", 1.5, fixed(2.5, 0), fixed(-0.125, 2)), "1.500000 2 -0.12");
    EXPECT_EQ(formatted("{}", std::numeric_limits<double>::max()).size(), 309U + 7U);
}

TEST(Utf8, TellsWhatIsWellFormed) {
    // The first and the last of every length, and their neighbours.
    std::istringstream words("207f c280 dfbf e0a080 ed9fbf ee8080 efbfbf f0908080 f48fbfbf "
                             "ff 80 bf c080 c1bf c2 c241 c2c280 e09fbf e6b0 eda080 edbfbf f08fbfbf f09085 "
                             "f4908080 f5808080");
    bool expected = true;
    for (std::string word; words >> word;) {
        expected = expected && word != "ff"; // the first that is not
        const auto bytes = test::fromHex(word);
        for (std::size_t i = 0; i < 17 * 3; ++i) {
            const std::string text = std::string(i / 3, 'a') + std::string(bytes.begin(), bytes.end()) +
                                     std::string(i % 3 * 4, 'z');
            EXPECT_EQ(isUtf8(text), expected) << word << " behind " << i / 3;
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
    for (const char* text :
         {"Z", "Zg=", "Zg===", "====", "Z===", "Zh==", "Zm9=", "Zm-_", "Zm9v\n", "Zg==Zg==", "Zm=v"}) {
        EXPECT_EQ(decodeBase64(text), std::nullopt) << text;
    }
}

TEST(Rfc3339, WritesTimes) {
    const std::vector<std::pair<double, const char*>> rows{
        {-0.25, "1969-12-31T23:59:59.750Z"},
        {951782399.9996, "2000-02-29T00:00:00.000Z"},
        {4107542400, "2100-03-01T00:00:00.000Z"},
        {-62167219200, "0000-01-01T00:00:00.000Z"},
        {-62167219201, nullptr},
        {253402300799.999, "9999-12-31T23:59:59.999Z"},
        {253402300799.9997, nullptr},
        {std::numeric_limits<double>::quiet_NaN(), nullptr}};
    for (const auto& [seconds, text] : rows) {
        const std::string expected = text == nullptr ? "none" : text;
        EXPECT_EQ(formatRfc3339(seconds).value_or("none"), expected) << seconds;
        EXPECT_EQ(formatRfc3339Date(seconds).value_or("none"), expected.substr(0, 10)) << seconds;
    }
}

} // namespace
} // namespace tamblo
