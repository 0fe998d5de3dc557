#include "workers/sinks/ZRReportingSessionMemoryLogWorker.h"

#include "platform/ProcessList.h"
#include "session/ZRReportingSession.h"
#include "util/AudioEvents.h"

#include <utility>

namespace tamblo {

void ZRReportingSessionMemoryLogWorker::handleMessage(const MessageRef& message) {
    if (message == nullptr || message->type() != AudioEventTypeMemoryLog) {
        return;
    }
    const WallTime now = platform().clock->now();
    const auto ownSession = session();
    if (ownSession == nullptr || !isDue(now)) {
        return;
    }
    lastLogged_ = now;
    ProcessList processes;
    processes.add(ownSession->processIdentifiers());
    processes.addNamedBy(message->payload());
    platform().memoryLog->logMemory(ownSession->reporterID(), std::move(processes).take());
}

bool ZRReportingSessionMemoryLogWorker::isDue(WallTime now) const noexcept {
    return !lastLogged_ || now < *lastLogged_ || now - *lastLogged_ >= kLeastInterval;
}

} // namespace tamblo
