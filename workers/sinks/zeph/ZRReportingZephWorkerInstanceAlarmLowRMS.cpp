#include "workers/sinks/zeph/ZRReportingZephWorkerInstanceAlarmLowRMS.h"

#include "session/ZRReportingSession.h"
#include "util/Log.h"
#include "workers/sinks/ZRReportingSessionZephWorker.h"

namespace tamblo {

ZRReportingZephWorkerInstanceAlarmLowRMS::ZRReportingZephWorkerInstanceAlarmLowRMS(
    Context& context, std::weak_ptr<ZRReportingSession> session)
    : ZRReportingSessionZephWorkerInstance(context, std::move(session)) {
    auto state = std::make_shared<WorkerInstanceState>();
    state->interestThresholdCount = 3;
    // Without effect beside a threshold of the count.
    state->interestThresholdDurationSeconds = std::chrono::seconds(15);
    state->oncePerSession = true;
    setWorkerState(std::move(state));
}

bool ZRReportingZephWorkerInstanceAlarmLowRMS::interestedInMessage(
    const ZRReportingSessionMessage& message) const {
    if (message.category() != AudioEventKindError || message.type() != AudioEventTypeIssueDetector) {
        return false;
    }
    const Value* issue = message.payload().find("issue_type");
    if (issue == nullptr || issue->stringValue() != "LowRMS") {
        return false;
    }
    const std::shared_ptr<ZRReportingSession> owner = session();
    return owner != nullptr &&
           (owner->serviceType() == AudioServiceTypeAlarms || owner->serviceType() == AudioServiceTypeTest);
}

void ZRReportingZephWorkerInstanceAlarmLowRMS::fire(const ZRReportingSessionMessage& message) {
    const std::shared_ptr<ZRReportingSession> owner = session();
    const std::shared_ptr<WorkerInstanceState>& state = workerState();
    if (owner == nullptr || state->symptomReporter == nullptr) {
        return;
    }
    const auto reply = [weakState = std::weak_ptr(state),
                        timeout = zephAlarmLowRmsDuration_.count()](const Dictionary& response) {
        const std::string identifier =
            ZRReportingSessionZephWorker::getSessionIdentifierFromResponse(response);
        if (const auto stillThere = weakState.lock()) {
            stillThere->setCurrentZephSessionIdentifier(identifier);
        }
        log::info(ZRReportingZephLogCategory(),
                  "Started Zeph session for alarm Low RMS. sessionId={} timeout={} response={}", identifier,
                  timeout, response);
    };
    const BugCaptureSignature signature = ZRReportingSessionZephWorker::signatureFromMessage(
        message, owner->serviceType(), owner->clientProcessName().value_or(""));
    if (state->symptomReporter->startSession(signature, zephAlarmLowRmsDuration_, reply)) {
        log::info(ZRReportingZephLogCategory(),
                  "Parameters to Zeph session for alarm Low RMS accepted. Will fire if not cancelled. "
                  "timeout={}.",
                  zephAlarmLowRmsDuration_.count());
    } else {
        log::error(ZRReportingZephLogCategory(), "Zeph session for alarm Low RMS failed to start.");
    }
}

void ZRReportingZephWorkerInstanceAlarmLowRMS::stop() {
    const std::optional<std::string> identifier = workerState()->currentZephSessionIdentifier();
    if (!identifier) {
        return;
    }
    log::info(ZRReportingZephLogCategory(),
              "Stop called. Cancelling Zeph session for alarm Low RMS. sessionId={} timeout={}", *identifier,
              zephAlarmLowRmsDuration_.count());
    if (workerState()->symptomReporter != nullptr) {
        workerState()->symptomReporter->cancelSession(*identifier);
    }
}

} // namespace tamblo
