#include "tests/fakes/FakePlatform.h"

#include "util/InternalBuild.h"
#include "util/LogCategories.h"
#include "util/ReportingServerQueue.h"

namespace tamblo {

FakePlatform::FakePlatform(LogLevel threshold, bool isInternalBuild) {
    log.setThreshold(threshold);
    deviceProperties.set("InternalBuild", isInternalBuild);
    installWith({});
    forgetLogThresholds();
    forgetInternalBuild();
    resetReportingServerQueue();
}

void FakePlatform::installWith(const Others& others) {
    const auto choose = [](auto* other, auto& fake) -> auto& {
        return other != nullptr ? *other : fake;
    };
    installPlatform({.clock = clock,
                     .workQueues = choose(others.workQueues, workQueues),
                     .log = log,
                     .tracePoints = choose(others.tracePoints, tracePoints),
                     .deviceProperties = deviceProperties,
                     .preferences = preferences,
                     .namedNotifications = namedNotifications,
                     .processInformation = processInformation,
                     .deviceConditions = deviceConditions,
                     .analyticsEvents = choose(others.analyticsEvents, analyticsEvents),
                     .powerEvents = powerEvents,
                     .diagnosticsMetrics = diagnosticsMetrics,
                     .callQuality = choose(others.callQuality, callQuality),
                     .reportFiles = reportFiles,
                     .bugCapture = bugCapture,
                     .bugReportDrafting = bugReportDrafting,
                     .diagnosticCapture = diagnosticCapture,
                     .memoryLog = memoryLog,
                     .chanlog = choose(others.chanlog, chanlog),
                     .processSampling = processSampling,
                     .accessories = accessories,
                     .connections = connections});
}

FakePlatform::~FakePlatform() {
    resetReportingServerQueue();
    workQueues.workOff();
}

FakeSerialQueue& FakePlatform::serverQueue() {
    return static_cast<FakeSerialQueue&>(ZRReportingUtilityGetReportingServerQueue());
}

} // namespace tamblo
