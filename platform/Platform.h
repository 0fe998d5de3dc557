#pragma once

#include "platform/Accessories.h"
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
#include "platform/MemoryLog.h"
#include "platform/NamedNotifications.h"
#include "platform/PowerEventLog.h"
#include "platform/Preferences.h"
#include "platform/ProcessInformation.h"
#include "platform/ProcessSampling.h"
#include "platform/ReportFiles.h"
#include "platform/StructuredLog.h"
#include "platform/TracePoints.h"
#include "platform/WorkQueue.h"

namespace tamblo {

/// The services that the system finds on the device, one of each. Installed once, before anything else runs,
/// and alive until the process ends; a test installs its fakes the same way.
struct Platform {
    Clock& clock;
    WorkQueues& workQueues;
    StructuredLog& log;
    TracePoints& tracePoints;
    DeviceProperties& deviceProperties;
    Preferences& preferences;
    NamedNotifications& namedNotifications;
    ProcessInformation& processInformation;
    DeviceConditions& deviceConditions;
    AnalyticsEventService& analyticsEvents;
    PowerEventLog& powerEvents;
    DiagnosticsMetricsService& diagnosticsMetrics;
    CallQualityService& callQuality;
    ReportFiles& reportFiles;
    BugCaptureService& bugCapture;
    BugReportDraftingService& bugReportDrafting;
    DiagnosticCaptureService& diagnosticCapture;
    MemoryLog& memoryLog;
    ChanlogFacility& chanlog;
    ProcessSampling& processSampling;
    Accessories& accessories;
    ConnectionService& connections;
};

/// Makes these the platform of the process, in place of any before. Not while work runs.
void installPlatform(const Platform& platform);
/// The installed platform. Before one is installed there is none, and calling this is a fault.
[[nodiscard]] const Platform& platform() noexcept;

} // namespace tamblo
