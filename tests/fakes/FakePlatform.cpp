#include "tests/fakes/FakePlatform.h"

#include "util/InternalBuild.h"
#include "util/LogCategories.h"
#include "util/ReportingServerQueue.h"

namespace tamblo {

FakePlatform::FakePlatform(LogLevel threshold, bool isInternalBuild) {
    log.setThreshold(threshold);
    deviceProperties.set("InternalBuild", isInternalBuild);
    installPlatform({clock, workQueues, log, tracePoints, deviceProperties, preferences, namedNotifications,
                     processInformation, deviceConditions, analyticsEvents, powerEvents, diagnosticsMetrics,
                     callQuality, reportFiles, connections});
    forgetLogThresholds();
    forgetInternalBuild();
    resetReportingServerQueue();
}

FakePlatform::~FakePlatform() {
    resetReportingServerQueue();
    workQueues.workOff();
}

FakeSerialQueue& FakePlatform::serverQueue() {
    return static_cast<FakeSerialQueue&>(ZRReportingUtilityGetReportingServerQueue());
}

} // namespace tamblo
