#include "workers/producers/ZRReportingSessionSummaryWorker.h"

#include "session/ZRReportingSession.h"
#include "util/Log.h"
#include "util/MessageKeys.h"
#include "workers/producers/PayloadFields.h"

#include <array>
#include <string_view>
#include <utility>
#include <variant>

namespace tamblo {

namespace {

enum class Field { duration, issue, count };
using Fields = PayloadFields<Field>;
constexpr Fields::Keys kKeys{ZRReportingMessageKeySessionDuration, kIssueTypeKey};

std::string_view thermalStateName(int state) noexcept {
    constexpr std::array<std::string_view, 4> kNames{"Nominal", "Fair", "Serious", "Critical"};
    return state >= 0 && state < static_cast<int>(kNames.size()) ? kNames[static_cast<std::size_t>(state)]
                                                                 : "Unknown";
}

void addFootprint(Dictionary& payload, const ProcessInformation& process) {
    const auto footprint = process.physicalFootprint();
    if (const auto* error = std::get_if<ProcessInformation::QueryError>(&footprint)) {
        log::error(ZRReportingSummaryLogCategory(), "Error with task_info(): {}", error->text);
        return;
    }
    // The figure wraps at 4 GiB; those who collect it count on that.
    const auto lowBytes = static_cast<std::uint32_t>(std::get<std::uint64_t>(footprint));
    payload.set("vmInfo_phys_footprint_MiB", lowBytes >> 20U);
}

void addDeviceState(Dictionary& payload, const Platform& device) {
    payload.set("thermal_state", thermalStateName(device.deviceConditions->thermalState()));
    payload.set("low_power_enabled", device.deviceConditions->isLowPowerModeEnabled() ? 1 : 0);
    addFootprint(payload, *device.processInformation);
    const auto [oneMinute, fiveMinutes, fifteenMinutes] = device.processInformation->loadAverages();
    payload.set("load_avg_1_min", oneMinute);
    payload.set("load_avg_5_min", fiveMinutes);
    payload.set("load_avg_15_min", fifteenMinutes);
}

} // namespace

/// Where the keys stand; shared, as messages are of few kinds, and most have neither key.
struct ZRReportingSessionSummaryWorker::Places {
    KeyPlaces places{kKeys};
};

ZRReportingSessionSummaryWorker::ZRReportingSessionSummaryWorker(Context& context,
                                                                 std::weak_ptr<ZRReportingSession> session)
    : ZRReportingSessionWorkerConsumerProtocol(context, std::move(session)),
      places_(context.shared<Places>()) {}

void ZRReportingSessionSummaryWorker::handleMessage(const MessageRef& message) {
    const Fields fields(message->payload(), places_.places);
    if (fields.holds(Field::duration)) {
        totalActiveTime_ += fields[Field::duration]->doubleValue();
        ++activeCount_;
        return;
    }
    if (fields.holds(Field::issue) && fields[Field::issue]->stringValue() == "overload") {
        ++overloadCount_;
    }
}

bool ZRReportingSessionSummaryWorker::stopSome() {
    if (const std::shared_ptr<ZRReportingSession> owner = session()) {
        owner->sendMessage(std::make_shared<ZRReportingSessionMessage>(
            summaryOf(*owner), AudioEventSubsystemSession | AudioEventKindGeneric, AudioEventTypeSummary));
    }
    return true;
}

Dictionary ZRReportingSessionSummaryWorker::summaryOf(const ZRReportingSession& session) const {
    const std::uint64_t accepted = session.acceptedMessageCount();
    Dictionary payload{
        {"total_active_time", totalActiveTime_},
        {"active_count", activeCount_},
        {"overload_count", overloadCount_},
        {"average_active_time", activeCount_ != 0 ? totalActiveTime_ / activeCount_ : 0.0},
        {"num_messages", session.totalMessageCount()},
        {"num_unique_messages", accepted},
        {"num_redundant_messages", static_cast<std::uint64_t>(session.totalMessageCount()) - accepted},
        {"singleMessageSession", session.isSingleMessageSession()},
        {"summaryServiceName", session.serviceName()},
        {ZRReportingApplicationName, ZRReportingUtilityRetrieveAppName(session.configuration())},
    };
    if (session.clientProcessName()) {
        payload.set("clientProcessName", *session.clientProcessName());
    }
    addDeviceState(payload, platform());
    return payload;
}

} // namespace tamblo
