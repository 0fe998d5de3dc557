#include "system/ZRReportingSessionSystemMonitorWorker.h"

#include "session/ZRReportingSession.h"
#include "system/ZRReportingSystemMonitor.h"
#include "util/MessageKeys.h"

#include <utility>

namespace tamblo {

namespace {

constexpr std::string_view kLastUpdatedKey = "last_updated";

} // namespace

ZRReportingSessionSystemMonitorWorker::ZRReportingSessionSystemMonitorWorker(
    Context& context, std::weak_ptr<ZRReportingSession> session)
    : ZRReportingSessionWorkerProducerProtocol(context, std::move(session)),
      systemMonitorDictionary_(ZRReportingSystemMonitor::getSystemMonitorDictionary(context)),
      featureKeys_(ZRReportingSystemMonitor::getSystemMonitorKeys(context)) {}

std::optional<bool> ZRReportingSessionSystemMonitorWorker::start() {
    if (systemMonitorDictionary_ == nullptr) {
        return true;
    }
    observations_.reserve(featureKeys_.size());
    for (const std::string_view key : featureKeys_) {
        handleChange(systemMonitorDictionary_->find(key));
        observations_.push_back(systemMonitorDictionary_->addKeyObserver(*this, key));
    }
    return true;
}

bool ZRReportingSessionSystemMonitorWorker::stopSome() {
    observations_.clear();
    return true;
}

void ZRReportingSessionSystemMonitorWorker::keyValueChanged(std::string_view key) {
    handleChange(systemMonitorDictionary_->find(key));
}

void ZRReportingSessionSystemMonitorWorker::handleChange(Dictionary featureState) const {
    if (const Value* timestamp = featureState.find(ZRReportingInternalEventEpochTime)) {
        // The message gets a timestamp of its own when it is sent.
        featureState.set(kLastUpdatedKey, Value(*timestamp));
        featureState.remove(ZRReportingInternalEventEpochTime);
        featureState.remove(ZRReportingInternalEventSystemUptimeSec);
    }
    const std::shared_ptr<ZRReportingSession> owner = session();
    // A change amid the session's stop comes too late for whoever would have it.
    if (featureState.empty() || owner == nullptr || owner->isStopping()) {
        return;
    }
    owner->sendMessage(std::make_shared<ZRReportingSessionMessage>(std::move(featureState),
                                                                   AudioEventKindSetup, AudioEventTypeSetup));
}

} // namespace tamblo
