#include "workers/sinks/ZRReportingSessionMemoryLogWorker.h"

#include "platform/Counters.h"
#include "platform/ProcessList.h"
#include "session/ZRReportingSession.h"
#include "util/AudioEvents.h"

#include <chrono>
#include <utility>

namespace tamblo {

namespace {

/// Messages that come sooner after a recorded one are left out.
constexpr std::chrono::seconds kLeastInterval{1};

} // namespace

void ZRReportingSessionMemoryLogWorker::handleMessage(const MessageRef& message) {
    if (message == nullptr || message->type() != AudioEventTypeMemoryLog) {
        return;
    }
    const WallTime now = platform().clock->now();
    const auto ownSession = session();
    // A clock that was set back holds nothing up.
    const bool isSoon = lastLogged_ && now >= *lastLogged_ && now - *lastLogged_ < kLeastInterval;
    if (ownSession == nullptr || isSoon) {
        counters::add(counters::Counter::memoryRecordsRate);
        return;
    }
    lastLogged_ = now;
    ProcessList processes;
    processes.add(ownSession->processIdentifiers());
    processes.addNamedBy(message->payload());
    counters::add(counters::Counter::processes, processes.leftOut());
    platform().memoryLog->logMemory(ownSession->reporterID(), std::move(processes).take());
}

} // namespace tamblo
