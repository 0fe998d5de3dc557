#include "workers/sinks/LinkmeterAgent.h"

#include "base/WhileAlive.h"
#include "platform/Counters.h"
#include "util/Log.h"
#include "util/MessageKeys.h"
#include "workers/sinks/LinkmeterSummary.h"
#include "workers/sinks/ZRReportingSessionRtcWorker.h"

#include <atomic>
#include <chrono>
#include <utility>

namespace tamblo {

namespace {

constexpr std::chrono::seconds kBackendPatience{9};
/// A summary of more than this is no quick work.
constexpr std::size_t kMostQuickPayloads = 100;
constexpr std::size_t kMostQuickBytes = 64U << 10U;

constexpr AudioEventCategory kSummaryCategory = 0xFFFFFFFF;
constexpr AudioEventType kSummaryType = 0xFFFF;

bool isQuick(const std::vector<Dictionary>& payloads) noexcept {
    std::size_t bytes = 0;
    for (std::size_t i = 0; i < payloads.size() && i < kMostQuickPayloads; ++i) {
        bytes += payloads[i].bytesOfValues(Dictionary::Shared::inFull);
    }
    return payloads.size() <= kMostQuickPayloads && bytes <= kMostQuickBytes;
}

} // namespace

/// Of all sessions. Any thread.
struct LinkmeterAgent::WaitingBytes {
    std::atomic<std::size_t> count{0};
};

LinkmeterAgent::Messages::~Messages() {
    all.count.fetch_sub(bytes, std::memory_order_relaxed);
    counters::add(counters::Counter::messagesLostSessionGone, list.size());
}

/// Counts a piece for as long as it is there, whatever becomes of it.
class LinkmeterAgent::CountedPiece {
public:
    explicit CountedPiece(LinkmeterAgent& agent) noexcept : agent_(&agent) { ++agent.posted_; }
    CountedPiece(CountedPiece&& other) noexcept : agent_(std::exchange(other.agent_, nullptr)) {}
    CountedPiece& operator=(CountedPiece&&) = delete;
    ~CountedPiece() {
        if (agent_ != nullptr) {
            --agent_->posted_;
        }
    }

private:
    LinkmeterAgent* agent_;
};

LinkmeterAgent::LinkmeterAgent(Context& context)
    : context_(context), waiting_(context.shared<WaitingBytes>()) {}

template <typename Piece> void LinkmeterAgent::post(Piece piece, Pace pace) {
    if (linkmeterQueue_ == nullptr) {
        linkmeterQueue_ =
            context_.platform().workQueues->makeSerialQueue("com.vandra.tamblo.session.linkmeter");
    }
    linkmeterQueue_->post(
        [self = shared_from_this(), piece = std::move(piece), counted = CountedPiece(*this)]() mutable {
            if (!self->isDropped_) {
                piece(*self);
            }
        },
        pace);
}

void LinkmeterAgent::start(Dictionary sessionInfo, Dictionary userInfo) {
    {
        const MutexLock held(mutex_);
        toSend_.reset();
        isSetUp_ = false;
        isFullTold_ = false;
    }
    post([sessionInfo = std::move(sessionInfo), userInfo = std::move(userInfo)](
             LinkmeterAgent& agent) mutable { agent.setUp(std::move(sessionInfo), userInfo); });
}

void LinkmeterAgent::send(const Dictionary& payload, AudioEventCategory category, AudioEventType type) {
    const bool isIdle = isSetUp_ && posted_ == 0;
    if (!isIdle || !sendAtOnce(payload, category, type)) {
        queue({payload, category, type});
    }
}

void LinkmeterAgent::queue(Message message) {
    const MutexLock held(mutex_);
    const bool isFirst = toSend_ == nullptr;
    const std::shared_ptr<Messages> messages = isFirst ? std::make_shared<Messages>(waiting_) : toSend_;
    if (addWaiting(*messages, message)) {
        messages->list.push_back(std::move(message));
    }
    if (isFirst) {
        post([messages](LinkmeterAgent& agent) { agent.sendAll(messages); });
        toSend_ = messages;
    }
}

bool LinkmeterAgent::addWaiting(Messages& messages, const Message& message) {
    const std::size_t bytes =
        sizeof(Message) + message.payload.bytesOfValues(Dictionary::Shared::inProportion);
    if (waiting_.count.fetch_add(bytes, std::memory_order_relaxed) + bytes <= kMostWaitingBytes) {
        messages.bytes += bytes;
        return true;
    }
    waiting_.count.fetch_sub(bytes, std::memory_order_relaxed);
    counters::add(counters::Counter::messagesLostCallQuality);
    if (!std::exchange(isFullTold_, true)) {
        log::error(ZRReportingSessionLinkmeterCategory(),
                   "too many messages wait to be sent; what comes while they do is lost");
    }
    return false;
}

void LinkmeterAgent::stop(std::optional<std::vector<Dictionary>> payloads, AudioServiceType serviceType,
                          ReporterID reporterID) {
    {
        const MutexLock held(mutex_);
        toSend_.reset();
        ++stopsToCome_;
    }
    const Pace pace = !payloads || isQuick(*payloads) ? Pace::quick : Pace::mayBlock;
    post([payloads = std::move(payloads), serviceType, reporterID](
             LinkmeterAgent& agent) mutable { agent.finish(std::move(payloads), serviceType, reporterID); },
         pace);
}

void LinkmeterAgent::abandon() {
    const MutexLock held(mutex_);
    isAbandoned_ = true;
    if (isWaiting_ && stopsToCome_ == 0) {
        isDropped_ = true;
        timeOut_.reset();
        linkmeterQueue_->resume();
    }
}

void LinkmeterAgent::setUp(Dictionary sessionInfo, const Dictionary& userInfo) {
    const LogCategory& category = ZRReportingSessionLinkmeterCategory();
    CallQualityService& service = *context_.platform().callQuality;
    isSetUp_ = false; // the wait of the run before may have ended since the start
    log::debug(category, "entering linkmeter {}", "start");
    const std::optional<std::string> token = service.NewHierarchyToken({});
    if (!token) {
        log::error(category,
                   "newHierarchyTokenFromParentToken returned nil. Will skip rtc for this session. {}",
                   "start");
        const MutexLock held(mutex_);
        isSetUp_ = true;
        return;
    }
    sessionInfo.set(linkmeter::HierarchyToken, *token);
    linkmeterSession_ = service.CreateLinkmeterSession(sessionInfo, userInfo);
    service.StartConfiguration(linkmeterSession_,
                               whileAlive(weak_from_this(), [](LinkmeterAgent& agent, const auto& backends) {
                                   agent.backendsFound(backends);
                               }));
    waitForBackends();
}

void LinkmeterAgent::waitForBackends() {
    log::standard(ZRReportingSessionLinkmeterCategory(), "waiting to find backends");
    const MutexLock held(mutex_);
    if (signals_ != 0) {
        --signals_;
        isSetUp_ = true;
        tellWhatWasFound();
    } else if (isAbandoned_ && stopsToCome_ == 0) {
        isDropped_ = true;
    } else {
        isWaiting_ = true;
        timeOut_ = context_.platform().workQueues->callAfter(
            kBackendPatience, whileAlive(weak_from_this(), [number = ++waitNumber_](LinkmeterAgent& agent) {
                agent.timeOut(number);
            }));
        linkmeterQueue_->suspend();
    }
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
    const MutexLock held(mutex_);
    if (isWaiting_) {
        isWaiting_ = false;
        isSetUp_ = true;
        timeOut_.reset();
        tellWhatWasFound();
        linkmeterQueue_->resume();
    } else {
        ++signals_;
    }
}

void LinkmeterAgent::tellWhatWasFound() const {
    log::standard(ZRReportingSessionLinkmeterCategory(), "{}",
                  linkmeterSessionStarted_ ? "continuing with backends!" : "failed to find backend");
}

void LinkmeterAgent::timeOut(std::uint64_t waitNumber) {
    const MutexLock held(mutex_);
    if (isWaiting_ && waitNumber_ == waitNumber) {
        isWaiting_ = false;
        // Back ends that are found later still turn the worker on. It then has no session to send to, and
        // what it sends is lost quietly; this is meant.
        log::standard(ZRReportingSessionLinkmeterCategory(), "timed out waiting for backends");
        linkmeterSession_.reset();
        isSetUp_ = true;
        linkmeterQueue_->resume();
    }
}

void LinkmeterAgent::sendAll(const std::shared_ptr<Messages>& messages) {
    {
        const MutexLock held(mutex_);
        if (toSend_ == messages) {
            toSend_.reset();
        }
    }
    for (Message& message : messages->list) {
        const Message sent = std::move(message);
        if (linkmeterSessionStarted_) {
            sendMessage(sent.payload, sent.category, sent.type);
        } else {
            counters::add(counters::Counter::messagesLostNoBackEnds);
            log::standard(ZRReportingSessionLinkmeterCategory(), "Session never started. {}",
                          "handleMessage");
        }
    }
    messages->list.clear();
}

bool LinkmeterAgent::sendAtOnce(const Dictionary& payload, AudioEventCategory category, AudioEventType type) {
    if (!linkmeterSessionStarted_) {
        return false;
    }
    if (linkmeterSession_ == nullptr) {
        counters::add(counters::Counter::messagesLostNoBackEnds);
    } else if (!context_.platform().callQuality->trySendLinkmeterMessage(
                   linkmeterSession_,
                   ZRReportingSessionRtcWorker::retrieveLinkmeterCategoryFromCategory(category), type,
                   payload, keyLeftOut())) {
        return false;
    }
    logSending();
    logSent(payload, category, type);
    return true;
}

void LinkmeterAgent::sendMessage(const Dictionary& payload, AudioEventCategory category,
                                 AudioEventType type) {
    logSending();
    if (linkmeterSession_ == nullptr) {
        counters::add(counters::Counter::messagesLostNoBackEnds);
        return;
    }
    const std::optional<std::string> failure = context_.platform().callQuality->SendLinkmeterMessage(
        linkmeterSession_, ZRReportingSessionRtcWorker::retrieveLinkmeterCategoryFromCategory(category), type,
        payload, keyLeftOut());
    if (failure) {
        log::error(ZRReportingSessionLinkmeterCategory(), "error sending message {}", *failure);
    } else {
        logSent(payload, category, type);
    }
}

/// The timestamp leaves the device on internal builds only.
std::string_view LinkmeterAgent::keyLeftOut() const noexcept {
    return context_.isInternalBuild() ? std::string_view() : ZRReportingInternalEventEpochTime;
}

void LinkmeterAgent::logSending() {
    log::debug(ZRReportingSessionLinkmeterCategory(), "entering linkmeter {}", "_sendMessage");
}

void LinkmeterAgent::logSent(const Dictionary& payload, AudioEventCategory category,
                             AudioEventType type) const {
    const LogCategory& logCategory = ZRReportingSessionLinkmeterCategory();
    if (linkmeterSession_ != nullptr && logCategory.isOn(LogLevel::debug)) {
        Dictionary sent = payload;
        if (const std::string_view leftOut = keyLeftOut(); !leftOut.empty()) {
            sent.remove(leftOut);
        }
        log::debug(logCategory, "LinkmeterAgent {} : message {} : category {} : type {}",
                   linkmeterSession_->description(), sent, static_cast<std::int32_t>(category), type);
    }
}

void LinkmeterAgent::finish(std::optional<std::vector<Dictionary>> payloads, AudioServiceType serviceType,
                            ReporterID reporterID) {
    const LogCategory& category = ZRReportingSessionLinkmeterCategory();
    {
        const MutexLock held(mutex_);
        --stopsToCome_;
    }
    if (!linkmeterSessionStarted_) {
        counters::add(counters::Counter::messagesLostNoBackEnds, payloads ? 1 : 0);
        log::standard(category, "Session never started. {}", "stop");
        return;
    }
    if (payloads) {
        sendSummary(*std::move(payloads), serviceType, reporterID);
    }
    log::debug(category, "entering linkmeter {}", "stop");
    if (linkmeterSession_ != nullptr) {
        context_.platform().callQuality->FlushMessages(linkmeterSession_);
    }
    linkmeterSession_.reset();
    linkmeterSessionStarted_ = false;
    log::debug(category, "stopping and setting session to nil");
}

void LinkmeterAgent::sendSummary(std::vector<Dictionary> payloads, AudioServiceType serviceType,
                                 ReporterID reporterID) {
    const LogCategory& category = ZRReportingSessionLinkmeterCategory();
    auto [summary, leftOut] = LinkmeterSummary::of(std::move(payloads), serviceType);
    if (leftOut != 0) {
        counters::add(counters::Counter::summaryValues, leftOut);
        log::error(category, "{} values are left out of a summary that is full. reporterID={}", leftOut,
                   reporterID);
    }
    log::standard(category, "sending rtc summary event. reporterID={}", reporterID);
    for (std::size_t i = 0; i < summary.size() && category.isOn(LogLevel::debug); ++i) {
        log::debug(category, "sending rtc summary event. reporterID={} {}=\"{}\"", reporterID,
                   summary.keyAt(i), summary.valueAt(i));
    }
    sendMessage(summary, kSummaryCategory, kSummaryType);
}

} // namespace tamblo
