#include "tests/fakes/FakePlatform.h"
#include "util/AudioEvents.h"
#include "util/InternalBuild.h"
#include "util/Log.h"

#include <gmock/gmock.h>

#include <array>
#include <set>

namespace tamblo {
namespace {

TEST(VocabularyTest, CategoryNames) {
    const std::pair<AudioEventCategory, const char*> names[] = {{0x08000004, "Session_Playback"},
                                                                {0x04000006, "MIDI_PlaybackAndRecord"},
                                                                {0x10000003, "DSP_Input"},
                                                                {0x2000000B, "HAL_Error"},
                                                                {0x40000010, "Routing_HearingHealth"},
                                                                {0x80000011, "Toolbox_Wirrels"},
                                                                {0x00030001, "_Generic"},
                                                                {0x0C000001, "_Generic"},
                                                                {0x0001000C, "_Chanlog"},
                                                                {0x08000000, "Session_Undefined"},
                                                                {0x0000000E, "Volume"},
                                                                {0x0000000F, "Kaleen"},
                                                                {0, "Undefined"},
                                                                {18, "Undefined"},
                                                                {0x0000FFFF, "Undefined"},
                                                                {0xFFFFFFFF, "Undefined"},
                                                                {0x0800FFFF, "Session_Undefined"},
                                                                {13, "Performance"}};
    for (const auto& [category, name] : names) {
        EXPECT_EQ(ZRReportingUtilityCategoryString(category), name);
        const bool hasSubsystem = category > 0xFFFF && category != 0xFFFFFFFF;
        EXPECT_EQ(ZRReportingUtilityIsABTestModeOn(category), hasSubsystem) << category;
    }
    EXPECT_TRUE(ZRReportingUtilityIsABTestModeOn(0x00010000));
    for (AudioEventCategory kind = 1; kind <= 16; ++kind) {
        EXPECT_EQ(ZRReportingUtilityCategoryFromString(ZRReportingUtilityCategoryString(kind)), kind);
    }
    for (const char* name :
         {"Unknown", "Wirrels", "Undefined", "Session_Playback", "volume", "", "Volume "}) {
        EXPECT_EQ(ZRReportingUtilityCategoryFromString(name), AudioEventCategoryUnknown) << name;
    }
}

TEST(VocabularyTest, TypeNames) {
    for (AudioEventType type = 0; type <= 18; ++type) {
        EXPECT_EQ(ZRReportingUtilityTypeFromString(ZRReportingUtilityTypeString(type)), type);
    }
    const std::pair<AudioEventType, const char*> names[] = {{0, "Generic"},
                                                            {11, "Summary"},
                                                            {14, "Listeningenhancement"},
                                                            {18, "State"},
                                                            {19, "MemoryLog"},
                                                            {20, "Generic"},
                                                            {65534, "Generic"},
                                                            {65535, "Unknown"},
                                                            {8, "Joulery"},
                                                            {12, "HeadphoneAudioExposure"}};
    for (const auto& [type, name] : names) {
        EXPECT_EQ(ZRReportingUtilityTypeString(type), name);
    }
    EXPECT_EQ(ZRReportingUtilityTypeFromString("Unknown"), 65535);
    for (const char* name : {"MemoryLog", "ListeningEnhancement", "", "start"}) {
        EXPECT_EQ(ZRReportingUtilityTypeFromString(name), 0) << name;
    }
}

TEST(VocabularyTest, ServiceNames) {
    const std::array<const char*, 14> names{
        "generic",         "velka",         "telephony",        "haptics",          "alarms", "standalone",
        "soundautoconfig", "longformaudio", "nonlongformaudio", "audiodeviceusage", "alerts", "test",
        "apiusage",        "systemsounds"};
    for (AudioServiceType type = 0; type < names.size(); ++type) {
        EXPECT_EQ(ZRReportingUtilityGenerateServiceNameFromServiceType(type), names[type]);
        EXPECT_EQ(ZRReportingUtilityGenerateServiceTypeFromServiceName(names[type]), type);
    }
    EXPECT_EQ(ZRReportingUtilityGenerateServiceNameFromServiceType(14), "unknown");
    EXPECT_EQ(ZRReportingUtilityGenerateServiceNameFromServiceType(65535), "unknown");
    for (const char* name : {"unknown", "Telephony", ""}) {
        EXPECT_EQ(ZRReportingUtilityGenerateServiceTypeFromServiceName(name), 65535) << name;
    }
    EXPECT_EQ(ZRReportingUtilityVolumeMinimumPlayingTime(AudioServiceTypeHaptics), 0.5);
    EXPECT_EQ(ZRReportingUtilityRetrieveAppName({}).stringValue(), "Unknown");
    EXPECT_EQ(ZRReportingUtilityRetrieveAppName({{"HostApplicationDisplayID", 7}}).integerValue(), 7);
}

TEST(VocabularyTest, TheInternalBuildIsAskedForOnce) {
    for (const bool isInternal : {true, false}) {
        FakePlatform device(LogLevel::debug, isInternal);
        EXPECT_EQ(ZRReportingUtilityIsInternalBuild(), isInternal);
        device.deviceProperties.set("InternalBuild", !isInternal);
        EXPECT_EQ(ZRReportingUtilityIsInternalBuild(), isInternal);
    }
}

struct Costly {
    int* written;
};
void appendText(std::string& out, const Costly& costly) {
    ++*costly.written;
    out += "costly";
}

TEST(LogTest, LinesHaveAPrefixAndTextOnlyWhenOn) {
    FakePlatform device(LogLevel::info);
    int written = 0;
    log::debug(ZRReportingJouleryCategory(), "{}", Costly{&written});
    EXPECT_EQ(written, 0);
    const auto line = std::to_string(__LINE__ + 1);
    log::info(ZRReportingJouleryCategory(), "{} of {}: {} {}", Costly{&written}, Value("text"), Value(7),
              true);
    log::fault(ZRReportingQMXLogCategory(), "{}", Dictionary{{"a", Dictionary{{"b", 0.5}}}});
    const auto lines = device.log.lines();
    ASSERT_EQ(lines.size(), 2U);
    EXPECT_EQ(lines[0].prefix, "           VocabularyTest:" + line + std::string(5 - line.size(), ' ') + " ");
    EXPECT_EQ(lines[0].text, "costly of text: 7 1");
    EXPECT_EQ(lines[0].level, LogLevel::info);
    EXPECT_EQ(lines[0].category, "zrrp");
    EXPECT_EQ(lines[1].text, "{\"a\":{\"b\":0.5}}");
    EXPECT_EQ(lines[1].level, LogLevel::fault);
    EXPECT_EQ(written, 1);
}

TEST(LogTest, TwelveCategories) {
    std::set<std::string_view> codes;
    for (const LogCategory* category :
         {&ZRReportingClientCategory(), &ZRReportingServiceDelegateCategory(), &ZRReportingSessionCategory(),
          &ZRReportingSessionLinkmeterCategory(), &ZRReportingDriverUtilityCategory(),
          &ZRReportingTraceCategory(), &ZRReportingJouleryCategory(), &ZRReportingQMXLogCategory(),
          &ZRReportingZephLogCategory(), &ZRReportingSummaryLogCategory(), &ZRReportingDPLogCategory(),
          &ZRReportingAudioRegistrationCategory()}) {
        codes.insert(category->code());
    }
    EXPECT_THAT(codes, testing::ElementsAre("zrra", "zrrb", "zrrc", "zrrd", "zrri", "zrrl", "zrrp", "zrrr",
                                            "zrrs", "zrrt", "zrru", "zrrz"));
}

} // namespace
} // namespace tamblo
