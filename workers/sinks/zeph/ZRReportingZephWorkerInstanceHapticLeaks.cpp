#include "workers/sinks/zeph/ZRReportingZephWorkerInstanceHapticLeaks.h"

#include "workers/sinks/zeph/LeakSnapshot.h"

namespace tamblo {

namespace {

std::shared_ptr<WorkerInstanceState> makeState() {
    auto state = std::make_shared<WorkerInstanceState>();
    state->interestThresholdCount = 2;
    // Without effect beside a threshold of the count.
    state->interestThresholdDurationSeconds = std::chrono::seconds(60);
    return state;
}

} // namespace

ZRReportingZephWorkerInstanceHapticLeaks::ZRReportingZephWorkerInstanceHapticLeaks(
    Context& context, std::weak_ptr<ZRReportingSession> session)
    : ZRReportingSessionZephWorkerInstance(context, std::move(session)) {
    setWorkerState(context.shared<SharedWorkerInstanceStates>().of(kClassName, makeState));
}

bool ZRReportingZephWorkerInstanceHapticLeaks::interestedInMessage(
    const ZRReportingSessionMessage& message) const {
    return message.type() == AudioEventTypeJoulery &&
           message.payload().contains("Haptic_Active_Hardware_Time_Seconds");
}

void ZRReportingZephWorkerInstanceHapticLeaks::fire(const ZRReportingSessionMessage& message) {
    requestLeakSnapshot(*this, message, AudioServiceTypeHaptics, "haptics");
}

} // namespace tamblo
