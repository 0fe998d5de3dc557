#pragma once

#include "platform/Platform.h"
#include "tests/fakes/FakeAnalyticsEventService.h"
#include "tests/fakes/FakeBugCaptureService.h"
#include "tests/fakes/FakeBugReportDraftingService.h"
#include "tests/fakes/FakeCallQualityService.h"
#include "tests/fakes/FakeCaptures.h"
#include "tests/fakes/FakeChanlogFacility.h"
#include "tests/fakes/FakeClock.h"
#include "tests/fakes/FakeConnectionService.h"
#include "tests/fakes/FakeDeviceConditions.h"
#include "tests/fakes/FakeDeviceFigures.h"
#include "tests/fakes/FakeDeviceProperties.h"
#include "tests/fakes/FakeDiagnosticsMetricsService.h"
#include "tests/fakes/FakeLog.h"
#include "tests/fakes/FakeNamedNotifications.h"
#include "tests/fakes/FakePowerEventLog.h"
#include "tests/fakes/FakePreferences.h"
#include "tests/fakes/FakeProcessInformation.h"
#include "tests/fakes/FakeReportFiles.h"
#include "tests/fakes/FakeTracePoints.h"
#include "tests/fakes/FakeWorkQueues.h"

namespace tamblo {

/// A device in memory. Installed for as long as it lives; one at a time, and what a test makes on it goes
/// first.
class FakePlatform {
public:
    /// Lines from this level on are written; without an internal build unless it is asked for.
    explicit FakePlatform(LogLevel threshold = LogLevel::debug, bool isInternalBuild = false);
    ~FakePlatform();
    FakePlatform(const FakePlatform&) = delete;
    FakePlatform& operator=(const FakePlatform&) = delete;

    /// Services that a test brings along in place of the fakes; null for those that it does not.
    struct Others {
        WorkQueues* workQueues = nullptr;
        TracePoints* tracePoints = nullptr;
        AnalyticsEventService* analyticsEvents = nullptr;
        CallQualityService* callQuality = nullptr;
        ChanlogFacility* chanlog = nullptr;
    };
    void installWith(const Others& others);

    /// The process's reporting server queue, which runs when told.
    [[nodiscard]] FakeSerialQueue& serverQueue();

    FakeClock clock;
    FakeWorkQueues workQueues;
    FakeLog log;
    FakeTracePoints tracePoints;
    FakeDeviceProperties deviceProperties;
    FakePreferences preferences;
    FakeNamedNotifications namedNotifications;
    FakeProcessInformation processInformation;
    FakeDeviceConditions deviceConditions;
    FakeAnalyticsEventService analyticsEvents;
    FakePowerEventLog powerEvents;
    FakeDiagnosticsMetricsService diagnosticsMetrics;
    FakeCallQualityService callQuality;
    FakeReportFiles reportFiles;
    FakeBugCaptureService bugCapture;
    FakeBugReportDraftingService bugReportDrafting;
    FakeDiagnosticCaptureService diagnosticCapture;
    FakeMemoryLog memoryLog;
    FakeChanlogFacility chanlog;
    FakeProcessSampling processSampling;
    FakeAccessories accessories;
    FakeConnectionService connections;
};

} // namespace tamblo
