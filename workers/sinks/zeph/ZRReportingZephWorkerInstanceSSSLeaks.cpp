#include "workers/sinks/zeph/ZRReportingZephWorkerInstanceSSSLeaks.h"

#include "util/Log.h"
#include "workers/sinks/zeph/LeakSnapshot.h"

namespace tamblo {

namespace {

/// A stuck sound is reported again and again; its captures would all show the same.
constexpr std::chrono::seconds kBetweenFirings{15};

/// The last firing of any of the detectors. On the thread that does the sessions' work.
struct Firings {
    std::optional<WallTime> last;
};

std::shared_ptr<WorkerInstanceState> makeState() {
    auto state = std::make_shared<WorkerInstanceState>();
    state->interestThresholdCount = 1;
    return state;
}

} // namespace

ZRReportingZephWorkerInstanceSSSLeaks::ZRReportingZephWorkerInstanceSSSLeaks(
    Context& context, std::weak_ptr<ZRReportingSession> session)
    : ZRReportingSessionZephWorkerInstance(context, std::move(session)) {
    setWorkerState(context.shared<SharedWorkerInstanceStates>().of(kClassName, makeState));
}

bool ZRReportingZephWorkerInstanceSSSLeaks::interestedInMessage(
    const ZRReportingSessionMessage& message) const {
    return message.type() == AudioEventTypeJoulery &&
           message.payload().contains("System_Sound_Stuck_Time_Seconds");
}

void ZRReportingZephWorkerInstanceSSSLeaks::fire(const ZRReportingSessionMessage& message) {
    const WallTime now = context().platform().clock->now();
    std::optional<WallTime>& lastFiring = context().shared<Firings>().last;
    if (lastFiring && now - *lastFiring < kBetweenFirings) {
        log::info(ZRReportingZephLogCategory(), "Already fired {} recently.", kClassName);
        return;
    }
    lastFiring = now;
    requestLeakSnapshot(*this, message, AudioServiceTypeSystemSounds, "system sound server");
}

} // namespace tamblo
