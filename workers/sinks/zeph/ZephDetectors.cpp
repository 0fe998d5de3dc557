#include "base/Format.h"
#include "platform/Counters.h"
#include "session/ZRReportingSession.h"
#include "util/Log.h"
#include "util/MessageKeys.h"
#include "workers/sinks/ZRReportingSessionZephWorker.h"

#include <array>
#include <utility>

namespace tamblo {

namespace {

/// The reporters of leaks are clients of many kinds: the capture is not about the one that tells of it.
constexpr std::string_view kUnknownProcess = "Unknown";
/// A stuck sound is reported again and again; its captures would all show the same.
constexpr std::chrono::seconds kBetweenStuckSounds{15};
constexpr std::chrono::duration<double> kLowAlarmTimeout{60};

/// What answers a request for a capture: the state, while it is there, keeps the capture's identifier.
GlarnReporter::Reply replyTo(const std::shared_ptr<WorkerInstanceState>& state, std::string what,
                             std::string detail = {}) {
    return [weakState = std::weak_ptr(state), what = std::move(what),
            detail = std::move(detail)](const Dictionary& response) {
        const std::string identifier =
            ZRReportingSessionZephWorker::getSessionIdentifierFromResponse(response);
        if (const auto stillThere = weakState.lock()) {
            stillThere->setCurrentZephSessionIdentifier(identifier);
        }
        log::info(ZRReportingZephLogCategory(), "Started Zeph session for {}. sessionId={}{} response={}",
                  what, identifier, detail, response);
    };
}

/// Asks for a capture of what the device does now, which the collector of the power log is to fill with the
/// lines about the session's processes. `what` is said in the log.
void requestLeakSnapshot(const ZRReportingSessionZephWorkerInstance& detector,
                         const ZRReportingSessionMessage& message, AudioServiceType serviceType,
                         std::string what) {
    const std::shared_ptr<ZRReportingSession> owner = detector.session();
    const std::shared_ptr<WorkerInstanceState>& state = detector.workerState();
    if (owner == nullptr || state->symptomReporter == nullptr) {
        return;
    }
    const std::vector<pid_t>& processes = owner->processIdentifiers();
    const Dictionary filter{{"processIDs", Array(processes.begin(), processes.end())}};
    const Dictionary payload{
        {glarn::kDiagnosticExtensionParameters, Dictionary{{glarn::kPowerLogFilterProcess, filter}}}};
    if (state->symptomReporter->snapshot(
            ZRReportingSessionZephWorker::signatureFromMessage(message, serviceType, kUnknownProcess),
            std::chrono::duration<double>(0), payload, replyTo(state, std::move(what)))) {
        log::info(ZRReportingZephLogCategory(), "Parameters to Zeph session accepted.");
    } else {
        log::error(ZRReportingZephLogCategory(), "Parameters to Zeph session not accepted!");
    }
}

/// Has the device captured as it is when haptics hardware is held too long by clients that have forgotten
/// it. Counts over all sessions.
class ZRReportingZephWorkerInstanceHapticLeaks final : public ZRReportingSessionZephWorkerInstance {
public:
    static constexpr std::string_view kClassName = "ZRReportingZephWorkerInstanceHapticLeaks";

    ZRReportingZephWorkerInstanceHapticLeaks(Context& context, std::weak_ptr<ZRReportingSession> session)
        : ZRReportingSessionZephWorkerInstance(context, std::move(session)) {
        setWorkerState(context.shared<SharedWorkerInstanceStates>().of(kClassName, [] {
            auto state = std::make_shared<WorkerInstanceState>();
            state->interestThresholdCount = 2;
            // Without effect beside a threshold of the count.
            state->interestThresholdDurationSeconds = std::chrono::seconds(60);
            return state;
        }));
    }

    [[nodiscard]] bool interestedInMessage(const ZRReportingSessionMessage& message) const override {
        return message.type() == AudioEventTypeJoulery &&
               message.payload().contains("Haptic_Active_Hardware_Time_Seconds");
    }
    [[nodiscard]] bool canFire() const noexcept override { return true; }
    void fire(const ZRReportingSessionMessage& message) override {
        requestLeakSnapshot(*this, message, AudioServiceTypeHaptics, "haptics leaks");
    }
};

/// Has the device captured as it is when a sound of the system-sound server is stuck. Counts over all
/// sessions; as every message fires, captures are kept apart by a time.
class ZRReportingZephWorkerInstanceSSSLeaks final : public ZRReportingSessionZephWorkerInstance {
public:
    static constexpr std::string_view kClassName = "ZRReportingZephWorkerInstanceSSSLeaks";

    ZRReportingZephWorkerInstanceSSSLeaks(Context& context, std::weak_ptr<ZRReportingSession> session)
        : ZRReportingSessionZephWorkerInstance(context, std::move(session)) {
        setWorkerState(context.shared<SharedWorkerInstanceStates>().of(kClassName, [] {
            auto state = std::make_shared<WorkerInstanceState>();
            state->interestThresholdCount = 1;
            return state;
        }));
    }

    [[nodiscard]] bool interestedInMessage(const ZRReportingSessionMessage& message) const override {
        return message.type() == AudioEventTypeJoulery &&
               message.payload().contains("System_Sound_Stuck_Time_Seconds");
    }
    [[nodiscard]] bool canFire() const noexcept override { return true; }
    void fire(const ZRReportingSessionMessage& message) override {
        const WallTime now = context().platform().clock->now();
        std::optional<WallTime>& last = context().shared<Firings>().last;
        if (last && now - *last < kBetweenStuckSounds) {
            counters::add(counters::Counter::bugCapturesRate);
            log::info(ZRReportingZephLogCategory(), "Already fired {} recently.", kClassName);
            return;
        }
        last = now;
        requestLeakSnapshot(*this, message, AudioServiceTypeSystemSounds, "system sound server leaks");
    }

private:
    /// Of any of the detectors. On the thread that does the sessions' work.
    struct Firings {
        std::optional<WallTime> last;
    };
};

/// Opens a capture session when an alarm plays at a level too low to be heard, once for each session. The
/// stop of the session cancels it, so that it is kept only when the session outlives it.
class ZRReportingZephWorkerInstanceAlarmLowRMS final : public ZRReportingSessionZephWorkerInstance {
public:
    ZRReportingZephWorkerInstanceAlarmLowRMS(Context& context, std::weak_ptr<ZRReportingSession> session)
        : ZRReportingSessionZephWorkerInstance(context, std::move(session)) {
        auto state = std::make_shared<WorkerInstanceState>();
        state->interestThresholdCount = 3;
        // Without effect beside a threshold of the count.
        state->interestThresholdDurationSeconds = std::chrono::seconds(15);
        state->oncePerSession = true;
        setWorkerState(std::move(state));
    }

    [[nodiscard]] bool interestedInMessage(const ZRReportingSessionMessage& message) const override {
        const Value* issue = message.payload().find(kIssueTypeKey);
        const std::shared_ptr<ZRReportingSession> owner = session();
        return message.category() == AudioEventKindError && message.type() == AudioEventTypeIssueDetector &&
               issue != nullptr && issue->stringValue() == "LowRMS" && owner != nullptr &&
               (owner->serviceType() == AudioServiceTypeAlarms ||
                owner->serviceType() == AudioServiceTypeTest);
    }
    [[nodiscard]] bool canFire() const noexcept override { return true; }
    void fire(const ZRReportingSessionMessage& message) override {
        const std::shared_ptr<ZRReportingSession> owner = session();
        const std::shared_ptr<WorkerInstanceState>& state = workerState();
        if (owner == nullptr || state->symptomReporter == nullptr) {
            return;
        }
        if (state->symptomReporter->startSession(
                ZRReportingSessionZephWorker::signatureFromMessage(message, owner->serviceType(),
                                                                   owner->clientProcessName().value_or("")),
                kLowAlarmTimeout,
                replyTo(state, "alarm Low RMS", formatted(" timeout={}", kLowAlarmTimeout.count())))) {
            log::info(ZRReportingZephLogCategory(),
                      "Parameters to Zeph session for alarm Low RMS accepted. Will fire if not cancelled. "
                      "timeout={}.",
                      kLowAlarmTimeout.count());
        } else {
            log::error(ZRReportingZephLogCategory(), "Zeph session for alarm Low RMS failed to start.");
        }
    }
    /// The identifier is kept: every later stop cancels again, which the capture service takes for nothing.
    void stop() override {
        const std::optional<std::string> identifier = workerState()->currentZephSessionIdentifier();
        if (!identifier) {
            return;
        }
        log::info(ZRReportingZephLogCategory(),
                  "Stop called. Cancelling Zeph session for alarm Low RMS. sessionId={} timeout={}",
                  *identifier, kLowAlarmTimeout.count());
        if (workerState()->symptomReporter != nullptr) {
            workerState()->symptomReporter->cancelSession(*identifier);
        }
    }
};

/// Holds the place of a detector for the record queue of the voice controller: no message tells of its
/// destruction, so it is never interested.
class ZRReportingZephWorkerInstanceVocapDestroyRecordQueue final
    : public ZRReportingSessionZephWorkerInstance {
public:
    using ZRReportingSessionZephWorkerInstance::ZRReportingSessionZephWorkerInstance;

    [[nodiscard]] bool interestedInMessage(const ZRReportingSessionMessage&) const override { return false; }
};

template <typename Detector>
std::unique_ptr<ZRReportingSessionZephWorkerInstance>
initWithSession(Context& context, const std::shared_ptr<ZRReportingSession>& session) {
    return std::make_unique<Detector>(context, session);
}

constexpr std::array<ZephWorkerInstanceClass, 4> kInstanceClasses{{
    {.name = ZRReportingZephWorkerInstanceHapticLeaks::kClassName,
     .messageType = AudioEventTypeJoulery,
     .handleSingleMessageSession = true,
     .deviceProperty = "HapticLeakCapture",
     .initWithSession = initWithSession<ZRReportingZephWorkerInstanceHapticLeaks>},
    {.name = "ZRReportingZephWorkerInstanceAlarmLowRMS",
     .messageType = AudioEventTypeIssueDetector,
     .initWithSession = initWithSession<ZRReportingZephWorkerInstanceAlarmLowRMS>},
    {.name = "ZRReportingZephWorkerInstanceVocapDestroyRecordQueue",
     .initWithSession = initWithSession<ZRReportingZephWorkerInstanceVocapDestroyRecordQueue>},
    {.name = ZRReportingZephWorkerInstanceSSSLeaks::kClassName,
     .messageType = AudioEventTypeJoulery,
     .handleSingleMessageSession = true,
     .initWithSession = initWithSession<ZRReportingZephWorkerInstanceSSSLeaks>},
}};

} // namespace

std::span<const ZephWorkerInstanceClass> zephWorkerInstanceClasses() {
    return kInstanceClasses;
}

} // namespace tamblo
