#include "tests/fakes/FakePlatform.h"
#include "util/AudioEvents.h"
#include "util/DataSerialize.h"
#include "util/Log.h"
#include "util/NumberBuckets.h"
#include "util/ReportingUtilities.h"

#include <gmock/gmock.h>

#include <initializer_list>
#include <limits>
#include <optional>
#include <string>
#include <tuple>
#include <vector>

namespace tamblo {
namespace {

template <typename Number, typename Name>
std::string named(std::initializer_list<Number> numbers, Name name) {
    std::string names;
    for (const Number number : numbers) {
        names += std::string(name(number)) + " ";
    }
    return names;
}

TEST(VocabularyTest, NamesOfNumbers) {
    EXPECT_EQ(
        named<AudioEventCategory>({0, 1, 17, 18, 0xFFFF, 0xFFFFFFFF, 0x04000006, 0x08000004, 0x10000003,
                                   0x2000000B, 0x40000010, 0x80000011, 0x00030001, 0x0C000001, 0x0800FFFF},
                                  ZRReportingUtilityCategoryString),
        "Undefined Generic Wirrels Undefined Undefined Undefined MIDI_PlaybackAndRecord Session_Playback "
        "DSP_Input HAL_Error Routing_HearingHealth Toolbox_Wirrels _Generic _Generic Session_Undefined ");
    EXPECT_EQ(named<AudioEventType>({0, 19, 20, 65534, 65535}, ZRReportingUtilityTypeString),
              "Generic MemoryLog Generic Generic Unknown ");
    EXPECT_EQ(
        named<AudioServiceType>({0, 13, 14, 65535}, ZRReportingUtilityGenerateServiceNameFromServiceType),
        "generic systemsounds unknown unknown ");
}

TEST(VocabularyTest, NumbersOfNames) {
    for (AudioEventCategory kind = 1; kind <= 16; ++kind) {
        EXPECT_EQ(ZRReportingUtilityCategoryFromString(ZRReportingUtilityCategoryString(kind)), kind);
    }
    for (const char* name : {"Wirrels", "Undefined", "Session_Playback", "volume"}) {
        EXPECT_EQ(ZRReportingUtilityCategoryFromString(name), AudioEventCategoryUnknown) << name;
    }
    EXPECT_EQ(ZRReportingUtilityTypeFromString("State"), 18);
    EXPECT_EQ(ZRReportingUtilityTypeFromString("Unknown"), 65535);
    EXPECT_EQ(ZRReportingUtilityTypeFromString("MemoryLog"), 0);
    EXPECT_EQ(ZRReportingUtilityGenerateServiceTypeFromServiceName("systemsounds"), 13);
    EXPECT_EQ(ZRReportingUtilityGenerateServiceTypeFromServiceName("Telephony"), 65535);
}

struct Costly {
    int& written;
};
void appendText(std::string& out, const Costly& costly) {
    out += "costly " + std::to_string(++costly.written);
}

TEST(LogTest, LinesHaveAPrefixAndTextOnlyWhenOn) {
    FakePlatform device(LogLevel::info);
    int written = 0;
    log::debug(ZRReportingJouleryCategory(), "{}", Costly{written});
    log::info(ZRReportingJouleryCategory(), "{} of {}: {}", Costly{written}, Value("text"), Value(7));
    log::fault(ZRReportingQMXLogCategory(), "{}", Dictionary{{"a", Dictionary{{"b", 0.5}}}});
    EXPECT_THAT(device.log.texts(), testing::ElementsAre("costly 1 of text: 7", R"({"a":{"b":0.5}})"));
    const auto line = device.log.lines().back();
    EXPECT_THAT(line.prefix, testing::MatchesRegex("                 UtilTest:[0-9]+ +"));
    EXPECT_EQ(line.prefix.size(), 32U);
    EXPECT_TRUE(line.category == "zrra" && line.level == LogLevel::fault);
}

TEST(UtilitiesTest, NearestBucket) {
    const std::tuple<double, std::vector<double>, unsigned, std::optional<std::string>> cases[] = {
        {3, {1, 2, 4, 8}, 0, "4"}, {2.9, {1, 2, 4, 8}, 0, "2"}, {3, {3}, 2, "3.0"},
        {3, {3.256}, 2, "3.26"},   {1, {5, 9, 1}, 0, "5"},      {0, {-2.25}, 1, "-2.2"},
        {1, {}, 0, std::nullopt},
    };
    for (const auto& [value, buckets, digits, text] : cases) {
        EXPECT_EQ(ZRReportingUtilityBucketNumberToString(value, buckets, digits), text) << value;
    }
}

TEST(UtilitiesTest, Rounding) {
    EXPECT_EQ(ZRReportingUtilityRoundWithPlaces(-2.5, 0), -3);
    EXPECT_EQ(ZRReportingUtilityRoundWithPlaces(1234, -2), 1200);
    EXPECT_EQ(ZRReportingUtilityRoundWithPlaces(0.126, 2), 0.13);
}

TEST(DataSerializeTest, EveryKindOfValue) {
    const Dictionary list{
        {"array", Array{true, false, Array{}, Dictionary{}, -5, std::numeric_limits<std::uint64_t>::max(),
                        0.1F, -std::numeric_limits<double>::infinity(), Value::date(1772366400.75)}},
        {"data", Value::data(std::vector<std::uint8_t>{0, 1, 255})},
        {"k<&>", "a\r\n\"b\" é"}};
    const std::string expected = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<!DOCTYPE plist>\n"
                                 "<plist version=\"1.0\">\n<dict>\n\t<key>array</key>\n\t<array>\n"
                                 "\t\t<true/>\n\t\t<false/>\n\t\t<array/>\n\t\t<dict/>\n"
                                 "\t\t<integer>-5</integer>\n\t\t<integer>18446744073709551615</integer>\n"
                                 "\t\t<real>0.1</real>\n\t\t<real>-infinity</real>\n"
                                 "\t\t<date>2026-03-01T12:00:00Z</date>\n\t</array>\n"
                                 "\t<key>data</key>\n\t<data>AAH/</data>\n"
                                 "\t<key>k&lt;&amp;&gt;</key>\n\t<string>a&#13;\n\"b\" é</string>\n"
                                 "</dict>\n</plist>\n";
    EXPECT_EQ(DataSerialize::getDataXMLInfo(list), expected);
    EXPECT_EQ(DataSerialize::getXMLInfo(list), std::nullopt) << "not ASCII";
    EXPECT_EQ(DataSerialize::getXMLInfo("x"), DataSerialize::getDataXMLInfo("x"));
    EXPECT_THAT(DataSerialize::getPlistBlob(list).value(), testing::ElementsAreArray(expected));
    EXPECT_TRUE(DataSerialize::getBase64XMLBlob(true).value().starts_with("PD94bWwgdmVyc2lvbj0i"));
    EXPECT_EQ(DataSerialize::getPlistBlob(Array{Dictionary{{"a", "\x01"}}}), std::nullopt);
}

} // namespace
} // namespace tamblo
