#pragma once

#include "workers/sinks/zeph/ZRReportingSessionZephWorkerInstance.h"

#include <string_view>

namespace tamblo {

/// Asks the detector's reporter for a capture of what the device does now, which the collector of the power
/// log is to fill with the lines about the session's processes. `whatLeaks` is said in the log.
void requestLeakSnapshot(const ZRReportingSessionZephWorkerInstance& detector,
                         const ZRReportingSessionMessage& message, AudioServiceType serviceType,
                         std::string_view whatLeaks);

} // namespace tamblo
