#include "util/AudioEvents.h"

#include "util/MessageKeys.h"
#include "wire/Vocabulary.h"

namespace tamblo {

namespace {

template <typename Word> consteval bool same(std::uint32_t number, Word word) {
    return number == static_cast<std::uint32_t>(word);
}

} // namespace

// What the service acts on has the protocol's numbers.
static_assert([] {
    using enum wire::Subsystem;
    return same(AudioEventSubsystemSession, session) && same(AudioEventSubsystemHAL, hal);
}());
static_assert([] {
    using enum wire::EventKind;
    return same(AudioEventKindGeneric, generic) && same(AudioEventKindInput, input) &&
           same(AudioEventKindPlayback, playback) && same(AudioEventKindIO, io) &&
           same(AudioEventKindSetup, setup) && same(AudioEventKindError, error) &&
           same(AudioEventKindChanlog, chanlog) && same(AudioEventKindVolume, volume) &&
           same(AudioEventKindKaleen, kaleen) && same(AudioEventKindWirrels, wirrels);
}());
static_assert([] {
    using enum wire::EventType;
    return same(AudioEventTypeGeneric, generic) && same(AudioEventTypeStart, start) &&
           same(AudioEventTypeStop, stop) && same(AudioEventTypeSetup, setup) &&
           same(AudioEventTypeError, error) && same(AudioEventTypeIssueDetector, issueDetector) &&
           same(AudioEventTypeJoulery, joulery) && same(AudioEventTypeSummary, summary) &&
           same(AudioEventTypeSimple, simple) && same(AudioEventTypeHistogram, histogram) &&
           same(AudioEventTypeState, state) && same(AudioEventTypeMemoryLog, memoryLog) &&
           same(AudioEventTypeUnknown, unknown);
}());
static_assert([] {
    using enum wire::ServiceType;
    return same(AudioServiceTypeVelka, velka) && same(AudioServiceTypeTelephony, telephony) &&
           same(AudioServiceTypeHaptics, haptics) && same(AudioServiceTypeAlarms, alarms) &&
           same(AudioServiceTypeStandalone, standalone) && same(AudioServiceTypeAlerts, alerts) &&
           same(AudioServiceTypeTest, test) && same(AudioServiceTypeAPIUsage, apiUsage) &&
           same(AudioServiceTypeSystemSounds, systemSounds) && same(AudioServiceTypeUnknown, unknown);
}());
static_assert(same(AudioEventCategoryUnknown, wire::EventCategory::unknown));
// The names lie at their numbers.
static_assert(AudioEventKindWirrels + 1 == wire::kKindNames.size());
static_assert(AudioEventTypeMemoryLog + 1 == wire::kTypeNames.size());
static_assert(AudioServiceTypeSystemSounds + 1 == wire::kServiceNames.size());
static_assert(ZRReportingServiceNameUnknown == wire::kUnknownServiceName);

std::string ZRReportingUtilityCategoryString(AudioEventCategory category) {
    return wire::eventCategoryName(category);
}

AudioEventCategory ZRReportingUtilityCategoryFromString(std::string_view name) noexcept {
    // The last kind has a name but cannot be had by it.
    const auto kind = wire::numberNamed(wire::kKindNames, name, AudioEventKindWirrels);
    return kind.value_or(0) == 0 ? AudioEventCategoryUnknown : *kind;
}

std::string_view ZRReportingUtilityTypeString(AudioEventType type) noexcept {
    return wire::eventTypeName(type);
}

AudioEventType ZRReportingUtilityTypeFromString(std::string_view name) noexcept {
    if (name == wire::kUnknownName) {
        return AudioEventTypeUnknown;
    }
    // The last type has a name but cannot be had by it.
    const auto type = wire::numberNamed(wire::kTypeNames, name, AudioEventTypeMemoryLog);
    return static_cast<AudioEventType>(type.value_or(AudioEventTypeGeneric));
}

std::string_view ZRReportingUtilityGenerateServiceNameFromServiceType(AudioServiceType type) noexcept {
    return type < wire::kServiceNames.size() ? wire::kServiceNames[type] : wire::kUnknownServiceName;
}

AudioServiceType ZRReportingUtilityGenerateServiceTypeFromServiceName(std::string_view name) noexcept {
    return static_cast<AudioServiceType>(
        wire::numberNamed(wire::kServiceNames, name).value_or(AudioServiceTypeUnknown));
}

Value ZRReportingUtilityRetrieveAppName(const Dictionary& configuration) {
    const Value* name = configuration.find(ZRReportingApplicationName);
    return name != nullptr ? *name : Value(wire::kUnknownName);
}

} // namespace tamblo
