#include "workers/sinks/ZRReportingSessionZephWorker.h"

#include "session/ZRReportingSession.h"
#include "util/Log.h"

#include <array>
#include <utility>

namespace tamblo {

namespace {

constexpr std::string_view kNoSession = "NONE_RETURNED";

/// By `GlarnError`.
constexpr std::array<std::string_view, 10> kErrorNames{
    "kGlarnErrorNone",
    "kGlarnErrorServiceNotReady",
    "kGlarnErrorNotSupported",
    "kGlarnErrorServiceUnavailable",
    "kGlarnErrorServiceInterrupted",
    "kGlarnErrorInvalidParameters",
    "kGlarnErrorDailyLimitExceeded",
    "kGlarnErrorRandomizedSuppression",
    "kGlarnErrorSessionNotFound",
    "kGlarnErrorRequestThrottled",
};
static_assert(kGlarnErrorNone == 0 && kGlarnErrorRequestThrottled + 1 == kErrorNames.size());

void logFailure(const Value* reason) {
    if (reason == nullptr) {
        log::error(ZRReportingZephLogCategory(), "Failed starting zeph session. Unknown reason.");
        return;
    }
    const auto code = static_cast<std::int32_t>(reason->integerValue());
    if (code == kGlarnErrorNone) {
        log::error(ZRReportingZephLogCategory(), "Failed starting zeph session. reason={}", kErrorNames[0]);
    } else if (code > 0 && std::cmp_less(code, kErrorNames.size())) {
        log::info(ZRReportingZephLogCategory(), "Failed starting zeph session. reason={}",
                  kErrorNames[static_cast<std::size_t>(code)]);
    } else {
        log::info(ZRReportingZephLogCategory(), "Failed starting zeph session. reason={}", code);
    }
}

} // namespace

std::shared_ptr<ZRReportingSessionWorkerProtocol>
ZRReportingSessionZephWorker::initWithSession(Context& context,
                                              const std::shared_ptr<ZRReportingSession>& session) {
    if (!context.isInternalBuild()) {
        return nullptr;
    }
    auto worker = std::make_shared<ZRReportingSessionZephWorker>(context, session);
    for (const ZephWorkerInstanceClass& instanceClass : zephWorkerInstanceClasses()) {
        if (instanceClass.deviceProperty.empty() ||
            context.platform()
                .deviceProperties->booleanProperty(instanceClass.deviceProperty)
                .value_or(false)) {
            worker->addInstance(instanceClass);
        }
    }
    return worker;
}

void ZRReportingSessionZephWorker::addInstance(const ZephWorkerInstanceClass& instanceClass) {
    const std::shared_ptr<ZRReportingSession> owner = session();
    if (owner == nullptr || (owner->isSingleMessageSession() && !instanceClass.handleSingleMessageSession)) {
        return;
    }
    if (auto detector = instanceClass.initWithSession(context(), owner)) {
        instances_.push_back({&instanceClass, std::move(detector)});
    }
}

std::optional<bool> ZRReportingSessionZephWorker::start() {
    for (const Instance& instance : instances_) {
        instance.detector->start();
    }
    return true;
}

bool ZRReportingSessionZephWorker::stopSome() {
    for (const Instance& instance : instances_) {
        instance.detector->stop();
    }
    return true;
}

void ZRReportingSessionZephWorker::handleMessage(const MessageRef& message) {
    if (message == nullptr) {
        return;
    }
    for (const Instance& instance : instances_) {
        if (instance.instanceClass->messageType == message->type()) {
            consider(instance, *message);
        }
    }
}

void ZRReportingSessionZephWorker::consider(const Instance& instance,
                                            const ZRReportingSessionMessage& message) const {
    ZRReportingSessionZephWorkerInstance& detector = *instance.detector;
    if (!detector.interestedInMessage(message)) {
        return;
    }
    const std::shared_ptr<WorkerInstanceState> state = detector.workerState();
    const std::shared_ptr<ZRReportingSession> owner = session();
    if (state == nullptr || owner == nullptr || state->lastMessage == message.payload()) {
        return;
    }
    log::debug(ZRReportingZephLogCategory(), "Interested in message. instance={}, {}",
               instance.instanceClass->name, message);
    const WallTime now = platform().clock->now();
    ++state->interestedCount;
    if (!state->interestFirstSeen) {
        state->interestFirstSeen = now;
    }
    detector.handleMessage(message);
    state->lastMessage = message.payload();
    if (!detector.canFire() || !state->isDue(now)) {
        return;
    }
    state->symptomReporter = platform().bugCapture->makeReporter(owner->processIdentifiers());
    ++state->firedCount;
    if (owner->serviceType() == AudioServiceTypeTest) {
        log::info(ZRReportingZephLogCategory(), "Skipping actual fire, as we are running in test mode.");
    } else {
        detector.fire(message);
    }
    state->resetInterest();
}

std::string ZRReportingSessionZephWorker::getSessionIdentifierFromResponse(const Dictionary& response) {
    const Value* success = response.find(glarn::kReplySuccess);
    if (success == nullptr || !(*success == Value(true))) {
        logFailure(response.find(glarn::kReplyReason));
        return std::string(kNoSession);
    }
    const Value* identifier = response.find(glarn::kReplySessionID);
    if (identifier == nullptr) {
        log::error(ZRReportingZephLogCategory(), "Started Zeph session, but no sessionId found!");
        return std::string(kNoSession);
    }
    std::string text = formatted("{}", *identifier);
    log::info(ZRReportingZephLogCategory(), "Started Zeph session. sessionId={}", text);
    return text;
}

BugCaptureSignature
ZRReportingSessionZephWorker::signatureFromMessage(const ZRReportingSessionMessage& message,
                                                   AudioServiceType audioServiceType,
                                                   std::string_view clientProcessName) {
    return {.domain = "Tonmetry",
            .type = std::string(ZRReportingUtilityGenerateServiceNameFromServiceType(audioServiceType)),
            .subType = ZRReportingUtilityCategoryString(message.category()),
            .subTypeContext = std::string(ZRReportingUtilityTypeString(message.type())),
            .detectedProcess = std::string(clientProcessName)};
}

} // namespace tamblo
