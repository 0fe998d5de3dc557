#include "workers/sinks/zeph/ZRReportingZephWorkerInstanceSSSLeaks.h"

#include "platform/Platform.h"
#include "util/Log.h"
#include "workers/sinks/zeph/LeakSnapshot.h"

namespace tamblo {

namespace {

/// A stuck sound is reported again and again; its captures would all show the same.
constexpr std::chrono::seconds kBetweenFirings{15};

/// Used on the thread that does the sessions' work, like the state that the detectors share.
constinit std::optional<WallTime> lastFiring;

std::shared_ptr<WorkerInstanceState> makeState() {
    auto state = std::make_shared<WorkerInstanceState>();
    state->interestThresholdCount = 1;
    return state;
}

} // namespace

ZRReportingZephWorkerInstanceSSSLeaks::ZRReportingZephWorkerInstanceSSSLeaks(
    std::weak_ptr<ZRReportingSession> session)
    : ZRReportingSessionZephWorkerInstance(std::move(session)) {
    setWorkerState(sharedWorkerInstanceState(kClassName, makeState));
}

bool ZRReportingZephWorkerInstanceSSSLeaks::interestedInMessage(
    const ZRReportingSessionMessage& message) const {
    return message.type() == AudioEventTypeJoulery &&
           message.payload().contains("System_Sound_Stuck_Time_Seconds");
}

void ZRReportingZephWorkerInstanceSSSLeaks::fire(const ZRReportingSessionMessage& message) {
    const WallTime now = platform().clock.now();
    if (lastFiring && now - *lastFiring < kBetweenFirings) {
        log::info(ZRReportingZephLogCategory(), "Already fired {} recently.", kClassName);
        return;
    }
    lastFiring = now;
    requestLeakSnapshot(*this, message, AudioServiceTypeSystemSounds, "system sound server");
}

void ZRReportingZephWorkerInstanceSSSLeaks::forgetLastFiring() noexcept {
    lastFiring.reset();
}

} // namespace tamblo
