#include "workers/sinks/ZRReportingSessionJouleryWorker.h"

#include "session/ZRReportingSession.h"
#include "util/AudioEvents.h"
#include "util/Log.h"
#include "util/MessageKeys.h"

#include <optional>

namespace tamblo {

namespace {

constexpr std::uint32_t kHapticsSubsystem = 28;

constexpr std::string_view kEngineOnTime = "EngineOnTime";
constexpr std::string_view kEngineState = "EngineState";
constexpr std::string_view kActiveHardwareTime = "Haptic_Active_Hardware_Time_Seconds";
constexpr std::string_view kActiveClients = "Active_Clients";
constexpr std::string_view kEventApplicationName = "ApplicationName";
constexpr std::string_view kEventTimestampEnd = "TimestampEnd";

void post(const Platform& platform, std::string_view eventName, const Dictionary& event) {
    platform.powerEvents->postRegisteredPowerEvent(kHapticsSubsystem, eventName, event);
}

/// Nothing once the session is gone.
std::optional<Value> appNameOf(const std::shared_ptr<ZRReportingSession>& session) {
    return session == nullptr ? std::nullopt
                              : std::optional(ZRReportingUtilityRetrieveAppName(session->configuration()));
}

/// Whether the payload has the key; the event then has its value.
bool copyValue(Dictionary& event, std::string_view name, const Dictionary& payload, std::string_view key) {
    const Value* value = payload.find(key);
    if (value != nullptr) {
        event.set(name, *value);
    }
    return value != nullptr;
}

} // namespace

void ZRReportingSessionJouleryWorker::handleMessage(const MessageRef& message) {
    if (message == nullptr || message->type() != AudioEventTypeJoulery) {
        return;
    }
    const Dictionary& payload = message->payload();
    handleEngineOnDurationMessage(payload);
    handleEngineStateMessage(payload);
    handleLongRunningMessage(payload);
}

void ZRReportingSessionJouleryWorker::handleEngineOnDurationMessage(const Dictionary& payload) const {
    Dictionary event;
    if (!copyValue(event, "EngineOnDuration", payload, kEngineOnTime)) {
        return;
    }
    const auto appName = appNameOf(session());
    if (appName && !(*appName == Value("Unknown"))) {
        event.set(kEventApplicationName, *appName);
    } else {
        log::error(ZRReportingJouleryCategory(), "failed to get app name for joulery");
    }
    if (!copyValue(event, kEventTimestampEnd, payload, ZRReportingInternalEventEpochTime)) {
        log::error(ZRReportingJouleryCategory(), "failed to get ZRReporting timestamp for joulery");
    }
    post(platform(), "Korvell_Haptics_EngineOnDuration", event);
}

/// Unlike the event of the engine's duration, this one names an application that is not known, and nothing is
/// logged about what is missing. That is meant.
void ZRReportingSessionJouleryWorker::handleEngineStateMessage(const Dictionary& payload) const {
    const Value* state = payload.find(kEngineState);
    if (state == nullptr) {
        return;
    }
    Dictionary event{{"Status", *state == Value("EngineOn") ? 1 : 0}};
    if (const auto appName = appNameOf(session())) {
        event.set(kEventApplicationName, *appName);
    }
    (void)copyValue(event, kEventTimestampEnd, payload, ZRReportingInternalEventEpochTime);
    post(platform(), "Korvell_Haptics_ClientStatus", event);
}

void ZRReportingSessionJouleryWorker::handleLongRunningMessage(const Dictionary& payload) const {
    Dictionary event;
    if (copyValue(event, kActiveHardwareTime, payload, kActiveHardwareTime)) {
        (void)copyValue(event, kActiveClients, payload, kActiveClients);
        post(platform(), "LeakedHapticsSessionInfo", event);
    }
}

} // namespace tamblo
