#pragma once

#include "workers/sinks/zeph/ZRReportingSessionZephWorkerInstance.h"

namespace tamblo {

/// Holds the place of a detector for the record queue of the voice controller: no message tells of its
/// destruction yet, so it is never interested.
class ZRReportingZephWorkerInstanceVocapDestroyRecordQueue final
    : public ZRReportingSessionZephWorkerInstance {
public:
    using ZRReportingSessionZephWorkerInstance::ZRReportingSessionZephWorkerInstance;

    [[nodiscard]] bool interestedInMessage(const ZRReportingSessionMessage&) const override { return false; }
};

} // namespace tamblo
