#include "workers/sinks/LinkmeterAgent.h"

#include "util/Log.h"
#include "util/MessageKeys.h"
#include "workers/sinks/LinkmeterSummary.h"
#include "workers/sinks/ZRReportingSessionRtcWorker.h"

#include <chrono>
#include <utility>

namespace tamblo {

namespace {

constexpr std::chrono::seconds kBackendPatience{9};
/// A summary of more messages than this is no quick work.
constexpr std::size_t kQuickSummary = 100;

constexpr int kClientType = 19;
constexpr float kClientVersion = 2.1F;
constexpr std::string_view kClientName = "com.vandra.tamblo";
constexpr std::string_view kSessionIDKey = "ZRReportingSessionID";
constexpr AudioEventCategory kSummaryCategory = 0xFFFFFFFF;
constexpr AudioEventType kSummaryType = 0xFFFF;

Dictionary sessionInfo(const LinkmeterAgent::Identity& identity, const std::string& token) {
    const bool shouldBatch =
        ZRReportingSessionRtcWorker::shouldBatchLinkmeterEventsForServiceType(identity.serviceType);
    Dictionary info{
        {linkmeter::ClientType, kClientType},        {linkmeter::ClientVersion, kClientVersion},
        {linkmeter::SessionID, identity.reporterID}, {linkmeter::BatchEvent, shouldBatch},
        {linkmeter::HierarchyToken, token},          {linkmeter::ContainsRealtimeEvents, !shouldBatch},
    };
    if (const Value* name = identity.configuration.find(ZRReportingApplicationName)) {
        info.set(linkmeter::ClientBundleID, *name);
    }
    return info;
}

Dictionary userInfo(const LinkmeterAgent::Identity& identity) {
    Dictionary info{
        {linkmeter::ClientName, kClientName},
        {kSessionIDKey, identity.reporterID},
        {linkmeter::ServiceName, identity.serviceName},
    };
    info.merge(identity.configuration);
    return info;
}

} // namespace

void LinkmeterAgent::start(Identity identity) {
    post({[identity = std::move(identity)](LinkmeterAgent& agent) { agent.setUp(identity); }});
}

void LinkmeterAgent::send(Message message) {
    post({[message = std::move(message)](LinkmeterAgent& agent) mutable {
        agent.handle(std::move(message));
    }});
}

void LinkmeterAgent::stop(std::vector<MessageRef> messages, AudioServiceType serviceType,
                          ReporterID reporterID) {
    const Pace pace = messages.size() > kQuickSummary ? Pace::mayBlock : Pace::quick;
    post({[messages = std::move(messages), serviceType, reporterID](LinkmeterAgent& agent) {
              agent.finish(messages, serviceType, reporterID);
          },
          pace, true});
}

void LinkmeterAgent::post(Piece piece) {
    if (linkmeterQueue_ == nullptr) {
        linkmeterQueue_ =
            context_.platform().workQueues->makeSerialQueue("com.vandra.tamblo.session.linkmeter");
        linkmeterQueue_->setBatchEnd([&service = *context_.platform().callQuality] { service.commit(); });
    }
    const std::lock_guard held(mutex_);
    if (piece.isStop) {
        ++stopsPosted_;
        if (wait_ == Wait::waiting) {
            self_ = shared_from_this();
        }
    }
    const Pace pace = piece.pace;
    posted_.push_back(std::move(piece));
    if (!std::exchange(isQueued_, true)) {
        handToQueue(pace);
    }
}

void LinkmeterAgent::handToQueue(Pace pace) {
    linkmeterQueue_->post([self = shared_from_this(), pace] { self->run(pace); }, pace);
}

void LinkmeterAgent::run(Pace pace) {
    while (mayGoOn(pace)) {
        Piece piece = std::move(taken_[nextTaken_]);
        ++nextTaken_;
        piece.work(*this);
    }
}

bool LinkmeterAgent::mayGoOn(Pace pace) {
    if (isWaiting_ || (nextTaken_ == taken_.size() && !takePieces())) {
        return false;
    }
    if (pace == Pace::quick && taken_[nextTaken_].pace == Pace::mayBlock) {
        const std::lock_guard held(mutex_);
        handToQueue(Pace::mayBlock);
        return false;
    }
    return true;
}

bool LinkmeterAgent::takePieces() {
    // What the last ones took is given back: a session is idle most of the time.
    std::vector<Piece>().swap(taken_);
    nextTaken_ = 0;
    const std::lock_guard held(mutex_);
    isQueued_ = !posted_.empty();
    taken_.swap(posted_);
    return isQueued_;
}

void LinkmeterAgent::setUp(const Identity& identity) {
    const LogCategory& category = ZRReportingSessionLinkmeterCategory();
    CallQualityService& service = *context_.platform().callQuality;
    log::debug(category, "entering linkmeter {}", "start");
    linkmeterAgentToken_ = service.NewHierarchyToken({});
    if (!linkmeterAgentToken_) {
        log::error(category,
                   "newHierarchyTokenFromParentToken returned nil. Will skip rtc for this session. {}",
                   "start");
        return;
    }
    linkmeterSession_ =
        service.CreateLinkmeterSession(sessionInfo(identity, *linkmeterAgentToken_), userInfo(identity));
    service.StartConfiguration(linkmeterSession_, [weak = weak_from_this()](const auto& backends) {
        if (const auto agent = weak.lock()) {
            agent->backendsFound(backends);
        }
    });
    waitForBackends();
}

void LinkmeterAgent::backendsFound(const std::optional<std::vector<std::string>>& backends) {
    const LogCategory& category = ZRReportingSessionLinkmeterCategory();
    if (backends) {
        log::standard(category, "list of backends {}", Value(Array(backends->begin(), backends->end())));
    } else {
        log::error(category, "no backends found, this session won't get sent to the server");
    }
    // The session has marked the worker itself started when it started it. To mark it here, which may be
    // after its stop, would keep the session's next start from setting up anew.
    linkmeterSessionStarted_ = backends.has_value();
    signal();
}

void LinkmeterAgent::waitForBackends() {
    log::standard(ZRReportingSessionLinkmeterCategory(), "waiting to find backends");
    std::unique_lock held(mutex_);
    if (signals_ != 0) {
        --signals_;
        held.unlock();
        finishSetUp(false);
        return;
    }
    wait_ = Wait::waiting;
    const std::uint64_t number = ++waitNumber_;
    if (stopsPosted_ != 0) {
        self_ = shared_from_this();
    }
    held.unlock();
    isWaiting_ = true;
    timeOut_ = context_.platform().workQueues->callAfter(kBackendPatience, [weak = weak_from_this(), number] {
        if (const auto agent = weak.lock()) {
            agent->timeOut(number);
        }
    });
}

void LinkmeterAgent::signal() {
    const std::lock_guard held(mutex_);
    if (wait_ == Wait::waiting) {
        endWait(Wait::signalled);
    } else {
        ++signals_;
    }
}

void LinkmeterAgent::timeOut(std::uint64_t waitNumber) {
    const std::lock_guard held(mutex_);
    if (wait_ == Wait::waiting && waitNumber_ == waitNumber) {
        endWait(Wait::timedOut);
    }
}

void LinkmeterAgent::endWait(Wait outcome) {
    wait_ = outcome;
    linkmeterQueue_->post([self = shared_from_this()] { self->resume(); }, Pace::mayBlock);
    self_.reset();
}

void LinkmeterAgent::resume() {
    std::unique_lock held(mutex_);
    const bool isTimedOut = std::exchange(wait_, Wait::none) == Wait::timedOut;
    held.unlock();
    isWaiting_ = false;
    timeOut_.reset();
    finishSetUp(isTimedOut);
    run(Pace::mayBlock);
}

void LinkmeterAgent::finishSetUp(bool isTimedOut) {
    const LogCategory& category = ZRReportingSessionLinkmeterCategory();
    if (isTimedOut) {
        // Back ends that are found later still turn the worker on. It then has no session to send to, and
        // what it sends is lost quietly; this is meant.
        log::standard(category, "timed out waiting for backends");
        linkmeterSession_.reset();
        linkmeterAgentToken_.reset();
    } else if (linkmeterSessionStarted_) {
        log::standard(category, "continuing with backends!");
    } else {
        log::standard(category, "failed to find backend");
    }
}

void LinkmeterAgent::handle(Message message) {
    if (!linkmeterSessionStarted_) {
        log::standard(ZRReportingSessionLinkmeterCategory(), "Session never started. {}", "handleMessage");
        return;
    }
    sendMessage(std::move(message));
}

void LinkmeterAgent::sendMessage(Message message) {
    const LogCategory& category = ZRReportingSessionLinkmeterCategory();
    log::debug(category, "entering linkmeter {}", "_sendMessage");
    if (!context_.isInternalBuild()) {
        message.payload.remove(ZRReportingInternalEventEpochTime);
    }
    if (linkmeterSession_ == nullptr) {
        return;
    }
    const std::optional<std::string> failure = context_.platform().callQuality->SendLinkmeterMessage(
        linkmeterSession_,
        ZRReportingSessionRtcWorker::retrieveLinkmeterCategoryFromCategory(message.category), message.type,
        message.payload);
    if (failure) {
        log::error(category, "error sending message {}", *failure);
    } else if (category.isOn(LogLevel::debug)) {
        log::debug(category, "LinkmeterAgent {} : message {} : category {} : type {}",
                   linkmeterSession_->description(), message.payload,
                   static_cast<std::int32_t>(message.category), message.type);
    }
}

void LinkmeterAgent::finish(const std::vector<MessageRef>& messages, AudioServiceType serviceType,
                            ReporterID reporterID) {
    const LogCategory& category = ZRReportingSessionLinkmeterCategory();
    {
        const std::lock_guard held(mutex_);
        --stopsPosted_;
    }
    if (!linkmeterSessionStarted_) {
        log::standard(category, "Session never started. {}", "stop");
        return;
    }
    if (!messages.empty()) {
        sendSummary(messages, serviceType, reporterID);
    }
    log::debug(category, "entering linkmeter {}", "stop");
    if (linkmeterSession_ != nullptr) {
        context_.platform().callQuality->FlushMessages(linkmeterSession_);
    }
    linkmeterSession_.reset();
    linkmeterAgentToken_.reset();
    linkmeterSessionStarted_ = false;
    log::debug(category, "stopping and setting session to nil");
}

void LinkmeterAgent::sendSummary(const std::vector<MessageRef>& messages, AudioServiceType serviceType,
                                 ReporterID reporterID) {
    const LogCategory& category = ZRReportingSessionLinkmeterCategory();
    Dictionary summary = linkmeterSummary(messages, serviceType);
    log::standard(category, "sending rtc summary event. reporterID={}", reporterID);
    for (std::size_t i = 0; i < summary.size() && category.isOn(LogLevel::debug); ++i) {
        log::debug(category, "sending rtc summary event. reporterID={} {}=\"{}\"", reporterID,
                   summary.keyAt(i), summary.valueAt(i));
    }
    sendMessage({std::move(summary), kSummaryCategory, kSummaryType});
}

} // namespace tamblo
