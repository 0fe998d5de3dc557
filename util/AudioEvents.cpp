#include "util/AudioEvents.h"

#include "util/MessageKeys.h"

#include <array>
#include <cstddef>
#include <utility>

namespace tamblo {

namespace {

constexpr AudioEventCategory kSubsystemHalf = 0xFFFF0000;
constexpr AudioEventCategory kKindHalf = 0x0000FFFF;
constexpr std::string_view kUnknown = "Unknown";

constexpr std::array<std::pair<AudioEventCategory, std::string_view>, 6> kSubsystemNames{{
    {AudioEventSubsystemMIDI, "MIDI"},
    {AudioEventSubsystemSession, "Session"},
    {AudioEventSubsystemDSP, "DSP"},
    {AudioEventSubsystemHAL, "HAL"},
    {AudioEventSubsystemRouting, "Routing"},
    {AudioEventSubsystemToolbox, "Toolbox"},
}};

constexpr std::array<std::string_view, 18> kKindNames{
    "Undefined",         "Generic",     "Record", "Input",         "Playback",      "Output",
    "PlaybackAndRecord", "IO",          "Setup",  "ClientRequest", "RouteChange",   "Error",
    "Chanlog",           "Performance", "Volume", "Kaleen",        "HearingHealth", "Wirrels"};
/// Kind 17 has a name but cannot be had by it.
constexpr std::size_t kKindsByName = 17;

constexpr std::array<std::string_view, 20> kTypeNames{"Generic",
                                                      "Start",
                                                      "Stop",
                                                      "Activate",
                                                      "Deactivate",
                                                      "Setup",
                                                      "Error",
                                                      "IssueDetector",
                                                      "Joulery",
                                                      "AudioUnitUsage",
                                                      "MIDIDriver",
                                                      "Summary",
                                                      "HeadphoneAudioExposure",
                                                      "AudioExposure",
                                                      "Listeningenhancement",
                                                      "Pulsedeck",
                                                      "Simple",
                                                      "Histogram",
                                                      "State",
                                                      "MemoryLog"};
/// Type 19 has a name but cannot be had by it.
constexpr std::size_t kTypesByName = 19;

constexpr std::array<std::string_view, 14> kServiceNames{
    "generic",         "velka",         "telephony",        "haptics",          "alarms", "standalone",
    "soundautoconfig", "longformaudio", "nonlongformaudio", "audiodeviceusage", "alerts", "test",
    "apiusage",        "systemsounds"};

std::string_view subsystemName(AudioEventCategory category) noexcept {
    for (const auto& [mask, name] : kSubsystemNames) {
        if ((category & kSubsystemHalf) == mask) {
            return name;
        }
    }
    return {};
}

} // namespace

std::string ZRReportingUtilityCategoryString(AudioEventCategory category) {
    std::string name;
    if (ZRReportingUtilityIsABTestModeOn(category)) {
        name += subsystemName(category);
        name += '_';
    }
    const AudioEventCategory kind = category & kKindHalf;
    name += kKindNames[kind < kKindNames.size() ? kind : 0];
    return name;
}

AudioEventCategory ZRReportingUtilityCategoryFromString(std::string_view name) noexcept {
    for (std::size_t kind = 1; kind < kKindsByName; ++kind) {
        if (kKindNames[kind] == name) {
            return static_cast<AudioEventCategory>(kind);
        }
    }
    return AudioEventCategoryUnknown;
}

std::string_view ZRReportingUtilityTypeString(AudioEventType type) noexcept {
    if (type == AudioEventTypeUnknown) {
        return kUnknown;
    }
    return kTypeNames[type < kTypeNames.size() ? type : AudioEventTypeGeneric];
}

AudioEventType ZRReportingUtilityTypeFromString(std::string_view name) noexcept {
    if (name == kUnknown) {
        return AudioEventTypeUnknown;
    }
    for (std::size_t type = 0; type < kTypesByName; ++type) {
        if (kTypeNames[type] == name) {
            return static_cast<AudioEventType>(type);
        }
    }
    return AudioEventTypeGeneric;
}

std::string_view ZRReportingUtilityGenerateServiceNameFromServiceType(AudioServiceType type) noexcept {
    return type < kServiceNames.size() ? kServiceNames[type] : ZRReportingServiceNameUnknown;
}

AudioServiceType ZRReportingUtilityGenerateServiceTypeFromServiceName(std::string_view name) noexcept {
    for (std::size_t type = 0; type < kServiceNames.size(); ++type) {
        if (kServiceNames[type] == name) {
            return static_cast<AudioServiceType>(type);
        }
    }
    return AudioServiceTypeUnknown;
}

Value ZRReportingUtilityRetrieveAppName(const Dictionary& configuration) {
    const Value* name = configuration.find(ZRReportingApplicationName);
    return name != nullptr ? *name : Value(kUnknown);
}

} // namespace tamblo
