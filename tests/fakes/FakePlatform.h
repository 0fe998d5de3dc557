#pragma once

#include "session/ZRReportingSession.h"
#include "tests/fakes/FakeDevice.h"
#include "tests/fakes/FakeSinks.h"
#include "tests/fakes/FakeWorkQueues.h"
#include "util/Context.h"
#include "util/LogCategories.h"

#include <memory>
#include <optional>
#include <utility>
#include <vector>

namespace tamblo {

/// A device in memory, and the context of the process on it; one at a time, and what a test makes on it goes
/// first.
class FakePlatform {
    Platform services_;

public:
    /// Lines from this level on are written; without an internal build unless it is asked for.
    explicit FakePlatform(LogLevel threshold = LogLevel::debug, bool isInternalBuild = false) {
        log.setThreshold(threshold);
        setInternalBuild(isInternalBuild);
    }
    FakePlatform(const FakePlatform&) = delete;
    FakePlatform& operator=(const FakePlatform&) = delete;

    [[nodiscard]] Context& context() noexcept { return *context_; }
    /// The server queue, which runs when told.
    [[nodiscard]] FakeSerialQueue& serverQueue() {
        return static_cast<FakeSerialQueue&>(context().serverQueue());
    }
    [[nodiscard]] std::shared_ptr<ZRReportingSession>
    makeSession(ReporterID reporterID = 5, std::vector<pid_t> processIdentifiers = {1}) {
        return ZRReportingSession::initWithID(context(), reporterID, std::move(processIdentifiers));
    }

    /// From now on, lines from this level on are written.
    void setThreshold(LogLevel threshold) {
        log.setThreshold(threshold);
        for (const LogCategory& category : log_categories::all) {
            category.turnOn(threshold);
        }
    }
    /// Restarts the process on another build.
    void setInternalBuild(bool isInternalBuild) {
        deviceProperties.properties["InternalBuild"] = isInternalBuild;
        restart();
    }
    /// As if the process were started anew: posted work is done, and nothing that sessions share is left.
    void restart() {
        context_.reset();
        context_.emplace(services_);
    }
    /// For a service of a test's own, before it is used; the fake's own is then gone.
    [[nodiscard]] Platform& services() noexcept { return services_; }

    FakeLog& log = provide<FakeLog>(services_.log);
    FakeClock& clock = provide<FakeClock>(services_.clock);
    FakeTracePoints& tracePoints = provide<FakeTracePoints>(services_.tracePoints);
    FakeProcessInformation& processInformation =
        provide<FakeProcessInformation>(services_.processInformation);
    FakeDeviceConditions& deviceConditions = provide<FakeDeviceConditions>(services_.deviceConditions);
    FakeNamedNotifications& namedNotifications =
        provide<FakeNamedNotifications>(services_.namedNotifications);
    FakeDeviceProperties& deviceProperties = provide<FakeDeviceProperties>(services_.deviceProperties);
    FakePreferences& preferences = provide<FakePreferences>(services_.preferences);
    FakeAnalyticsEventService& analyticsEvents =
        provide<FakeAnalyticsEventService>(services_.analyticsEvents);
    FakePowerEventLog& powerEvents = provide<FakePowerEventLog>(services_.powerEvents);
    FakeDiagnosticsMetricsService& diagnosticsMetrics =
        provide<FakeDiagnosticsMetricsService>(services_.diagnosticsMetrics);
    FakeCallQualityService& callQuality = provide<FakeCallQualityService>(services_.callQuality);
    FakeReportFiles& reportFiles = provide<FakeReportFiles>(services_.reportFiles);
    FakeBugCaptureService& bugCapture = provide<FakeBugCaptureService>(services_.bugCapture);
    FakeBugReportDraftingService& bugReportDrafting =
        provide<FakeBugReportDraftingService>(services_.bugReportDrafting);
    FakeMemoryLog& memoryLog = provide<FakeMemoryLog>(services_.memoryLog);
    FakeChanlogFacility& chanlog = provide<FakeChanlogFacility>(services_.chanlog);
    FakeProcessSampling& processSampling = provide<FakeProcessSampling>(services_.processSampling);
    FakeAccessories& accessories = provide<FakeAccessories>(services_.accessories);
    FakeConnectionService& connections = provide<FakeConnectionService>(services_.connections);
    FakeDiagnosticCaptureService& diagnosticCapture =
        provide<FakeDiagnosticCaptureService>(services_.diagnosticCapture);
    FakeWorkQueues& workQueues = provide<FakeWorkQueues>(services_.workQueues);

private:
    std::optional<Context> context_;
};

} // namespace tamblo
