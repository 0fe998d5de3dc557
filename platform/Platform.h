#pragma once

#include "platform/Accessories.h"
#include "platform/Activity.h"
#include "platform/AnalyticsEventService.h"
#include "platform/BugCaptureService.h"
#include "platform/BugReportDraftingService.h"
#include "platform/CallQualityService.h"
#include "platform/ChanlogFacility.h"
#include "platform/Clock.h"
#include "platform/ConnectionService.h"
#include "platform/DeviceConditions.h"
#include "platform/DeviceProperties.h"
#include "platform/DiagnosticCaptureService.h"
#include "platform/DiagnosticsMetricsService.h"
#include "platform/Limits.h"
#include "platform/MemoryLog.h"
#include "platform/MessageTap.h"
#include "platform/NamedNotifications.h"
#include "platform/PowerEventLog.h"
#include "platform/Preferences.h"
#include "platform/ProcessInformation.h"
#include "platform/ProcessSampling.h"
#include "platform/ReportFiles.h"
#include "platform/StructuredLog.h"
#include "platform/TracePoints.h"
#include "platform/WorkQueue.h"

#include <memory>
#include <utility>

namespace tamblo {

/// The services that the system finds on the device, one of each; owned by `main`, or by a test's fixture.
/// All are there before anything uses one. In the order in which they may need each other: the last goes
/// first, and while the work queues go, what was posted may still use all others.
struct Platform {
    Limits limits{};
    std::unique_ptr<Activity> activity = std::make_unique<Activity>();
    std::unique_ptr<MessageTap> messageTap = std::make_unique<NoMessageTap>();
    std::unique_ptr<StructuredLog> log;
    std::unique_ptr<Clock> clock;
    std::unique_ptr<TracePoints> tracePoints;
    std::unique_ptr<ProcessInformation> processInformation;
    std::unique_ptr<DeviceConditions> deviceConditions;
    std::unique_ptr<NamedNotifications> namedNotifications;
    std::unique_ptr<DeviceProperties> deviceProperties;
    std::unique_ptr<Preferences> preferences;
    std::unique_ptr<AnalyticsEventService> analyticsEvents;
    std::unique_ptr<PowerEventLog> powerEvents;
    std::unique_ptr<DiagnosticsMetricsService> diagnosticsMetrics;
    std::unique_ptr<CallQualityService> callQuality;
    std::unique_ptr<ReportFiles> reportFiles;
    std::unique_ptr<BugCaptureService> bugCapture;
    std::unique_ptr<BugReportDraftingService> bugReportDrafting;
    std::unique_ptr<MemoryLog> memoryLog;
    std::unique_ptr<ChanlogFacility> chanlog;
    std::unique_ptr<ProcessSampling> processSampling;
    std::unique_ptr<Accessories> accessories;
    std::unique_ptr<ConnectionService> connections;
    std::unique_ptr<DiagnosticCaptureService> diagnosticCapture;
    std::unique_ptr<WorkQueues> workQueues;
};

/// Makes a service in its place among the others; answers it as what it is, for those who wire it.
template <typename Service, typename Interface, typename... Arguments>
[[nodiscard]] Service& provide(std::unique_ptr<Interface>& place, Arguments&&... arguments) {
    auto service = std::make_unique<Service>(std::forward<Arguments>(arguments)...);
    Service& made = *service;
    place = std::move(service);
    return made;
}

} // namespace tamblo
