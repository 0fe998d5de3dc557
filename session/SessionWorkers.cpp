#include "session/ZRReportingSession.h"
#include "util/Log.h"

#include <algorithm>

namespace tamblo {

void ZRReportingSession::startWorkersFromClasses(std::span<const WorkerClass* const> classes) {
    for (const WorkerClass* workerClass : classes) {
        if (isSingleMessageSession_ && !workerClass->handleSingleMessageSession) {
            log::debug(
                ZRReportingSessionCategory(),
                "Skipping ZRReportingSessionWorker for single message session. action=skipped worker={} "
                "reporterID={}",
                *workerClass, reporterID_);
        } else if (hasWorkerOf(*workerClass)) {
            log::debug(ZRReportingSessionCategory(),
                       "ZRReportingSessionWorker already initialized. action=skipped worker={} reporterID={}",
                       *workerClass, reporterID_);
        } else {
            makeWorker(*workerClass);
        }
    }
    forEachWorker(&WorkerRole::consumer, &WorkerRole::producer, [this](const Worker& worker) {
        if (worker.instance->started()) {
            return;
        }
        const std::optional<bool> answer = worker.instance->start();
        worker.instance->setStarted(answer.value_or(true));
        if (answer) {
            log::debug(ZRReportingSessionCategory(),
                       "ZRReportingSessionWorker action=start worker={} started={} reporterID={}",
                       *worker.workerClass, yesOrNo(*answer), reporterID_);
        }
    });
}

void ZRReportingSession::makeWorker(const WorkerClass& workerClass) {
    log::debug(ZRReportingSessionCategory(),
               "Initializing ZRReportingSessionWorker. action=init worker={} reporterID={}", workerClass,
               reporterID_);
    auto instance = workerClass.initWithSession(context_, shared_from_this());
    if (instance == nullptr) {
        // Not remembered, so that the next start tries again.
        log::debug(ZRReportingSessionCategory(),
                   "ZRReportingSessionWorker failed to initialize. action=failure worker={} reporterID={}",
                   workerClass, reporterID_);
        return;
    }
    messageWorkers_.push_back({&workerClass, std::move(instance)});
    log::debug(ZRReportingSessionCategory(), "ZRReportingSessionWorker action=added worker={} reporterID={}",
               workerClass, reporterID_);
}

bool ZRReportingSession::hasWorkerOf(const WorkerClass& workerClass) const noexcept {
    return std::any_of(messageWorkers_.begin(), messageWorkers_.end(),
                       [&](const Worker& worker) { return worker.workerClass == &workerClass; });
}

void ZRReportingSession::deliver(const MessageRef& message) {
    for (const Worker& worker : messageWorkers_) {
        if (!worker.workerClass->role.consumer || !worker.instance->started() ||
            (message->isRedundant && !worker.instance->handleRedundantMessages()) ||
            !message->isFor(*worker.workerClass)) {
            continue;
        }
        worker.instance->handleMessage(message);
        log::debug(ZRReportingSessionCategory(),
                   "ZRReportingSessionWorker action=handleMessage worker={} reporterID={}",
                   *worker.workerClass, reporterID_);
    }
}

} // namespace tamblo
