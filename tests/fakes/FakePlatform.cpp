#include "tests/fakes/FakePlatform.h"

#include "util/LogCategories.h"

#include <utility>

namespace tamblo {

FakePlatform::FakePlatform(LogLevel threshold, bool isInternalBuild) {
    log.setThreshold(threshold);
    setInternalBuild(isInternalBuild);
}

void FakePlatform::setThreshold(LogLevel threshold) {
    log.setThreshold(threshold);
    for (const LogCategory& category : log_categories::all) {
        category.turnOn(threshold);
    }
}

void FakePlatform::setInternalBuild(bool isInternalBuild) {
    deviceProperties.set("InternalBuild", isInternalBuild);
    restart();
}

void FakePlatform::restart() {
    context_.reset();
    context_.emplace(services_);
}

FakeSerialQueue& FakePlatform::serverQueue() {
    return static_cast<FakeSerialQueue&>(context().serverQueue());
}

std::shared_ptr<ZRReportingSession> FakePlatform::makeSession(ReporterID reporterID,
                                                              std::vector<pid_t> processIdentifiers) {
    return ZRReportingSession::initWithID(context(), reporterID, std::move(processIdentifiers));
}

} // namespace tamblo
