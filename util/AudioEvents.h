#pragma once

#include "base/Dictionary.h"
#include "base/Value.h"

#include <chrono>
#include <cstdint>
#include <string>
#include <string_view>

namespace tamblo {

/// What a message is about: at most one subsystem in the high half, a kind in the low half.
using AudioEventCategory = std::uint32_t;
/// What happened.
using AudioEventType = std::uint16_t;
/// Which of the device's audio services a reporter belongs to.
using AudioServiceType = std::uint16_t;

// The numbers that the service itself acts on; all there are stand with their names in `wire/Vocabulary.h`.

inline constexpr AudioEventCategory AudioEventSubsystemSession = 0x08000000;
inline constexpr AudioEventCategory AudioEventSubsystemHAL = 0x20000000;

inline constexpr AudioEventCategory AudioEventKindGeneric = 1;
inline constexpr AudioEventCategory AudioEventKindInput = 3;
inline constexpr AudioEventCategory AudioEventKindPlayback = 4;
inline constexpr AudioEventCategory AudioEventKindIO = 7;
inline constexpr AudioEventCategory AudioEventKindSetup = 8;
inline constexpr AudioEventCategory AudioEventKindError = 11;
inline constexpr AudioEventCategory AudioEventKindChanlog = 12;
inline constexpr AudioEventCategory AudioEventKindVolume = 14;
inline constexpr AudioEventCategory AudioEventKindKaleen = 15;
inline constexpr AudioEventCategory AudioEventKindWirrels = 17;
inline constexpr AudioEventCategory AudioEventCategoryUnknown = 0xFFFFFFFF;

inline constexpr AudioEventType AudioEventTypeGeneric = 0;
inline constexpr AudioEventType AudioEventTypeStart = 1;
inline constexpr AudioEventType AudioEventTypeStop = 2;
inline constexpr AudioEventType AudioEventTypeSetup = 5;
inline constexpr AudioEventType AudioEventTypeError = 6;
inline constexpr AudioEventType AudioEventTypeIssueDetector = 7;
inline constexpr AudioEventType AudioEventTypeJoulery = 8;
inline constexpr AudioEventType AudioEventTypeSummary = 11;
inline constexpr AudioEventType AudioEventTypeSimple = 16;
inline constexpr AudioEventType AudioEventTypeHistogram = 17;
inline constexpr AudioEventType AudioEventTypeState = 18;
inline constexpr AudioEventType AudioEventTypeMemoryLog = 19;
inline constexpr AudioEventType AudioEventTypeUnknown = 65535;

inline constexpr AudioServiceType AudioServiceTypeVelka = 1;
inline constexpr AudioServiceType AudioServiceTypeTelephony = 2;
inline constexpr AudioServiceType AudioServiceTypeHaptics = 3;
inline constexpr AudioServiceType AudioServiceTypeAlarms = 4;
inline constexpr AudioServiceType AudioServiceTypeStandalone = 5;
inline constexpr AudioServiceType AudioServiceTypeAlerts = 10;
inline constexpr AudioServiceType AudioServiceTypeTest = 11;
inline constexpr AudioServiceType AudioServiceTypeAPIUsage = 12;
inline constexpr AudioServiceType AudioServiceTypeSystemSounds = 13;
inline constexpr AudioServiceType AudioServiceTypeUnknown = 65535;

inline constexpr std::string_view ZRReportingServiceNameUnknown = "unknown";

/// The category's name: the subsystem's, "_" and the kind's. A high half that is no subsystem still yields
/// the separator. The unknown category is "Undefined", which `ZRReportingUtilityCategoryFromString` does not
/// know.
[[nodiscard]] std::string ZRReportingUtilityCategoryString(AudioEventCategory category);
/// Knows the kinds 1 to 16 without a subsystem, and "Unknown"; anything else is the unknown category. For
/// settings and tools that give a category or type by its name.
[[nodiscard]] AudioEventCategory ZRReportingUtilityCategoryFromString(std::string_view name) noexcept;
/// A value without a name is "Generic".
[[nodiscard]] std::string_view ZRReportingUtilityTypeString(AudioEventType type) noexcept;
/// A text that names no type, and "MemoryLog", is the generic type.
[[nodiscard]] AudioEventType ZRReportingUtilityTypeFromString(std::string_view name) noexcept;
[[nodiscard]] std::string_view
ZRReportingUtilityGenerateServiceNameFromServiceType(AudioServiceType type) noexcept;
[[nodiscard]] AudioServiceType
ZRReportingUtilityGenerateServiceTypeFromServiceName(std::string_view name) noexcept;

/// Whether the category carries a subsystem half, known or not.
[[nodiscard]] constexpr bool ZRReportingUtilityIsABTestModeOn(AudioEventCategory category) noexcept {
    return category >= 0x00010000 && category != AudioEventCategoryUnknown;
}

/// The value of "HostApplicationDisplayID", or the text "Unknown".
[[nodiscard]] Value ZRReportingUtilityRetrieveAppName(const Dictionary& configuration);

/// A stretch of playing or recording has to be longer than this for a summary of its own; the same for every
/// service.
[[nodiscard]] constexpr std::chrono::duration<double>
ZRReportingUtilityVolumeMinimumPlayingTime(AudioServiceType) noexcept {
    return std::chrono::duration<double>(0.5);
}

} // namespace tamblo
