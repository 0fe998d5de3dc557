#include "workers/sinks/zeph/ZRReportingSessionZephWorkerInstance.h"
#include "workers/sinks/zeph/ZRReportingZephWorkerInstanceAlarmLowRMS.h"
#include "workers/sinks/zeph/ZRReportingZephWorkerInstanceHapticLeaks.h"
#include "workers/sinks/zeph/ZRReportingZephWorkerInstanceSSSLeaks.h"
#include "workers/sinks/zeph/ZRReportingZephWorkerInstanceVocapDestroyRecordQueue.h"

#include <array>

namespace tamblo {

namespace {

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
