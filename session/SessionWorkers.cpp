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
    for (const Worker& worker :
         inOrder(consumingMessageWorkers_, producingMessageWorkers_, messageWorkers_)) {
        startWorker(worker);
    }
}

void ZRReportingSession::makeWorker(const WorkerClass& workerClass) {
    log::debug(ZRReportingSessionCategory(),
               "Initializing ZRReportingSessionWorker. action=init worker={} reporterID={}", workerClass,
               reporterID_);
    std::shared_ptr<ZRReportingSessionWorkerProtocol> instance =
        workerClass.initWithSession(context_, shared_from_this());
    if (instance == nullptr) {
        // Not remembered, so that the next start tries again.
        log::debug(ZRReportingSessionCategory(),
                   "ZRReportingSessionWorker failed to initialize. action=failure worker={} reporterID={}",
                   workerClass, reporterID_);
        return;
    }
    Worker worker{&workerClass, std::move(instance), nullptr};
    worker.consumer = dynamic_cast<ZRReportingSessionWorkerConsumerProtocol*>(worker.instance.get());
    if (workerClass.role.consumer && worker.consumer != nullptr) {
        consumingMessageWorkers_.push_back(worker);
    }
    if (workerClass.role.producer) {
        producingMessageWorkers_.push_back(worker);
    }
    messageWorkers_.push_back(std::move(worker));
    log::debug(ZRReportingSessionCategory(), "ZRReportingSessionWorker action=added worker={} reporterID={}",
               workerClass, reporterID_);
}

bool ZRReportingSession::hasWorkerOf(const WorkerClass& workerClass) const noexcept {
    return std::any_of(messageWorkers_.begin(), messageWorkers_.end(),
                       [&](const Worker& worker) { return worker.workerClass == &workerClass; });
}

void ZRReportingSession::startWorker(const Worker& worker) {
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
}

ZRReportingSession::Workers ZRReportingSession::inOrder(const Workers& first, const Workers& second,
                                                        const Workers& third) {
    Workers ordered;
    for (const Workers* list : {&first, &second, &third}) {
        for (const Worker& worker : *list) {
            const auto isSame = [&](const Worker& other) { return other.instance == worker.instance; };
            if (std::none_of(ordered.begin(), ordered.end(), isSame)) {
                ordered.push_back(worker);
            }
        }
    }
    return ordered;
}

} // namespace tamblo
