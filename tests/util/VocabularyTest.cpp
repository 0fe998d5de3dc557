#include "tests/fakes/FakePlatform.h"
#include "util/AudioEvents.h"
#include "util/Context.h"
#include "util/Log.h"

#include <gmock/gmock.h>

#include <initializer_list>
#include <string>

namespace tamblo {
namespace {

template <typename Number, typename Name>
std::string named(std::initializer_list<Number> numbers, Name name) {
    std::string names;
    for (const Number number : numbers) {
        names += names.empty() ? "" : " ";
        names += name(number);
    }
    return names;
}

TEST(VocabularyTest, CategoryNames) {
    EXPECT_EQ(named<AudioEventCategory>(
                  {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16, 17, 18, 0, 0xFFFF, 0xFFFFFFFF},
                  ZRReportingUtilityCategoryString),
              "Generic Record Input Playback Output PlaybackAndRecord IO Setup ClientRequest RouteChange "
              "Error Chanlog "
              "Performance Volume Kaleen HearingHealth Wirrels Undefined Undefined Undefined Undefined");
    EXPECT_EQ(named<AudioEventCategory>({0x04000006, 0x08000004, 0x10000003, 0x2000000B, 0x40000010,
                                         0x80000011, 0x00030001, 0x0C000001, 0x08000000, 0x0800FFFF},
                                        ZRReportingUtilityCategoryString),
              "MIDI_PlaybackAndRecord Session_Playback DSP_Input HAL_Error Routing_HearingHealth "
              "Toolbox_Wirrels _Generic "
              "_Generic Session_Undefined Session_Undefined");
    EXPECT_EQ(named<AudioEventCategory>(
                  {0, 0xFFFF, 0x10000, 0x08000004, 0xFFFFFFFE, 0xFFFFFFFF},
                  [](auto category) { return yesOrNo(ZRReportingUtilityIsABTestModeOn(category)); }),
              "NO NO YES YES YES NO");
    for (AudioEventCategory kind = 1; kind <= 16; ++kind) {
        EXPECT_EQ(ZRReportingUtilityCategoryFromString(ZRReportingUtilityCategoryString(kind)), kind);
    }
    for (const char* name :
         {"Unknown", "Wirrels", "Undefined", "Session_Playback", "volume", "", "Volume "}) {
        EXPECT_EQ(ZRReportingUtilityCategoryFromString(name), AudioEventCategoryUnknown) << name;
    }
}

TEST(VocabularyTest, TypeNames) {
    EXPECT_EQ(named<AudioEventType>(
                  {0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16, 17, 18, 19, 20, 65534, 65535},
                  ZRReportingUtilityTypeString),
              "Generic Start Stop Activate Deactivate Setup Error IssueDetector Joulery AudioUnitUsage "
              "MIDIDriver Summary "
              "HeadphoneAudioExposure AudioExposure Listeningenhancement Pulsedeck Simple Histogram State "
              "MemoryLog Generic "
              "Generic Unknown");
    for (AudioEventType type = 0; type <= 18; ++type) {
        EXPECT_EQ(ZRReportingUtilityTypeFromString(ZRReportingUtilityTypeString(type)), type);
    }
    EXPECT_EQ(ZRReportingUtilityTypeFromString("Unknown"), 65535);
    for (const char* name : {"MemoryLog", "ListeningEnhancement", "", "start"}) {
        EXPECT_EQ(ZRReportingUtilityTypeFromString(name), 0) << name;
    }
}

TEST(VocabularyTest, ServiceNames) {
    EXPECT_EQ(
        named<AudioServiceType>({0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 65535},
                                ZRReportingUtilityGenerateServiceNameFromServiceType),
        "generic velka telephony haptics alarms standalone soundautoconfig longformaudio nonlongformaudio "
        "audiodeviceusage alerts test apiusage systemsounds unknown unknown");
    for (AudioServiceType type = 0; type < 14; ++type) {
        const auto name = ZRReportingUtilityGenerateServiceNameFromServiceType(type);
        EXPECT_EQ(ZRReportingUtilityGenerateServiceTypeFromServiceName(name), type);
    }
    for (const char* name : {"unknown", "Telephony", ""}) {
        EXPECT_EQ(ZRReportingUtilityGenerateServiceTypeFromServiceName(name), 65535) << name;
    }
    EXPECT_EQ(ZRReportingUtilityVolumeMinimumPlayingTime(AudioServiceTypeHaptics).count(), 0.5);
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

TEST(LogTest, TheTwelveCategories) {
    std::string codes;
    for (const auto accessor :
         {ZRReportingClientCategory, ZRReportingServiceDelegateCategory, ZRReportingSessionCategory,
          ZRReportingSessionLinkmeterCategory, ZRReportingDriverUtilityCategory, ZRReportingTraceCategory,
          ZRReportingJouleryCategory, ZRReportingQMXLogCategory, ZRReportingZephLogCategory,
          ZRReportingSummaryLogCategory, ZRReportingDPLogCategory, ZRReportingAudioRegistrationCategory}) {
        codes += accessor().code();
    }
    EXPECT_EQ(codes, "zrrczrrszrrrzrrizrrdzrrtzrrpzrrazrrbzrruzrrlzrrz");
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

} // namespace
} // namespace tamblo
