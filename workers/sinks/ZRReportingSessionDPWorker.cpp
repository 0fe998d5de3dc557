#include "workers/sinks/ZRReportingSessionDPWorker.h"

#include "base/Format.h"
#include "platform/Counters.h"
#include "session/BlockingWork.h"
#include "session/ZRReportingSession.h"
#include "util/AudioEvents.h"
#include "util/Log.h"
#include "util/MessageKeys.h"
#include "workers/sinks/CapturePreferences.h"

#include <algorithm>
#include <chrono>
#include <limits>
#include <optional>
#include <string>
#include <utility>

namespace tamblo {

namespace {

constexpr std::string_view kBufferSizeKey = "smallest_buffer_frame_size";
constexpr std::string_view kCycleKey = "io_cycle";

constexpr std::int32_t kUsualBufferSize = 512; ///< frames
constexpr double kLeastSecondsBetweenCaptures = 10.0;
/// The range of the 32 bits, unsigned, that a wait may have: about 71 minutes.
constexpr double kLongestWaitMicroseconds = std::numeric_limits<std::uint32_t>::max();

/// The nearest number of 32 bits; 0 when absent.
std::int32_t integerOf(const Value* value) noexcept {
    using Limits = std::numeric_limits<std::int32_t>;
    const std::int64_t number = value != nullptr ? value->integerValue() : 0;
    return static_cast<std::int32_t>(
        std::clamp(number, std::int64_t{Limits::min()}, std::int64_t{Limits::max()}));
}

/// Fractions are cut off. What is no time to wait, below zero or not a number, is none.
std::chrono::microseconds waitTimeOf(double microseconds) noexcept {
    const double within = microseconds > 0.0 ? std::min(microseconds, kLongestWaitMicroseconds) : 0.0;
    return std::chrono::microseconds(static_cast<std::uint32_t>(within));
}

void logNotDropped(const Dictionary& payload, double timeDifference) {
    log::debug(ZRReportingDPLogCategory(),
               "Did not drop stackburst, right conditions not met: buffer size : {}, time diff : {}, io "
               "cycle: {}",
               integerOf(payload.find(kBufferSizeKey)), timeDifference, integerOf(payload.find(kCycleKey)));
}

/// The value of a preference that is there, which the log tells.
std::optional<Value> told(std::string_view key, std::optional<Value> value) {
    if (value) {
        log::debug(ZRReportingDPLogCategory(), "Value of {} is {}", key, *value);
    }
    return value;
}

} // namespace

/// What the preferences ask for, as the worker that was made last read them. Used on the reporting server
/// queue alone.
struct ZRReportingSessionDPWorker::RunTimeValues {
    std::int32_t minimumBufferSize = kUsualBufferSize; ///< frames
    std::int32_t minimumCycle = 0;
    std::chrono::microseconds waitTime{0};
};

ZRReportingSessionDPWorker::ZRReportingSessionDPWorker(Context& context,
                                                       std::weak_ptr<ZRReportingSession> session)
    : ZRReportingSessionWorkerConsumerProtocol(context, std::move(session)),
      runTime_(context.shared<RunTimeValues>()) {}

std::shared_ptr<ZRReportingSessionWorkerProtocol>
ZRReportingSessionDPWorker::initWithSession(Context& context,
                                            const std::shared_ptr<ZRReportingSession>& session) {
    const bool isEnabled = getEnableFlag(context, "enable_stackburst");
    if (!context.isInternalBuild() || !isEnabled) {
        return nullptr;
    }
    auto& runTime = context.shared<RunTimeValues>();
    const std::int32_t bufferSize = getRunTimeDefaults(context, "io_buffer_size");
    runTime.minimumBufferSize = bufferSize != 0 ? bufferSize : kUsualBufferSize;
    runTime.minimumCycle = getRunTimeDefaults(context, "io_cycle");
    runTime.waitTime = waitTimeOf(getDoubleRunTimeDefaults(context, "wait_time"));
    context.serverQueue().setMayBlock(runTime.waitTime.count() != 0);
    return std::make_shared<ZRReportingSessionDPWorker>(context, session);
}

void ZRReportingSessionDPWorker::handleMessage(const MessageRef& message) {
    if (message == nullptr) {
        return;
    }
    const bool isInteresting = interestedInMessage(*message);
    if (!isInteresting && !ZRReportingDPLogCategory().isOn(LogLevel::debug)) {
        return;
    }
    const double now = secondsSince1970(platform().clock->now());
    if (isInteresting && isToBeCaptured(message->payload(), now)) {
        capture(*message, now);
    } else if (ZRReportingDPLogCategory().isOn(LogLevel::debug)) {
        // For messages of every other kind, too: the line is how a developer sees the worker at work.
        logNotDropped(message->payload(), now - lastMessageTime_);
    }
}

bool ZRReportingSessionDPWorker::interestedInMessage(const ZRReportingSessionMessage& message) {
    if (message.type() != AudioEventTypeError || message.category() != AudioEventKindIO) {
        return false;
    }
    log::info(ZRReportingDPLogCategory(), "Interested in overload");
    return true;
}

bool ZRReportingSessionDPWorker::isToBeCaptured(const Dictionary& payload, double now) const {
    if (integerOf(payload.find(kBufferSizeKey)) < runTime_.minimumBufferSize ||
        integerOf(payload.find(kCycleKey)) < runTime_.minimumCycle) {
        return false;
    }
    // A clock that was set back holds captures off until it has caught up.
    const bool isSoon = lastMessageTime_ != 0.0 && now - lastMessageTime_ <= kLeastSecondsBetweenCaptures;
    counters::add(counters::Counter::stackCapturesRate, isSoon ? 1 : 0);
    return !isSoon;
}

void ZRReportingSessionDPWorker::capture(ZRReportingSessionMessage& message, double now) {
    if (runTime_.waitTime.count() != 0) {
        platform().clock->sleepFor(runTime_.waitTime);
    }
    Dictionary payload = message.message();
    log::info(ZRReportingDPLogCategory(), "Dropping stackburst {}", message);
    std::string reason = formatted("{}", payload.find(ZRReportingApplicationName));
    platform().diagnosticCapture->captureStacks({.requester = "com.vandra.tamblo",
                                                 .captureType = "AudioOverloads",
                                                 .reason = std::move(reason),
                                                 .payload = std::move(payload),
                                                 .options = {1, 1, 0, 0, 0}});
    // Posting writes a file. Whether somebody could be told changes nothing here.
    context().shared<BlockingWork>(platform()).post([&notifications = *platform().namedNotifications] {
        static_cast<void>(notifications.PostNamedNotification("com.vandra.tamblo.dropped-stackburst"));
    });
    log::info(ZRReportingDPLogCategory(), "Dropped stackburst");
    lastMessageTime_ = now;
}

bool ZRReportingSessionDPWorker::getEnableFlag(Context& context, std::string_view key) {
    const auto value = told(key, flagPreference(context, key, ZRReportingDPLogCategory()));
    return value && value->boolValue();
}

std::int32_t ZRReportingSessionDPWorker::getRunTimeDefaults(Context& context, std::string_view key) {
    const auto value = told(key, numberPreference(context, key, ZRReportingDPLogCategory()));
    return integerOf(value ? &*value : nullptr);
}

double ZRReportingSessionDPWorker::getDoubleRunTimeDefaults(Context& context, std::string_view key) {
    const auto value = told(key, numberPreference(context, key, ZRReportingDPLogCategory()));
    return value ? value->doubleValue() : 0.0;
}

} // namespace tamblo
