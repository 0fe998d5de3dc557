#pragma once

#include "platform/WorkQueue.h"

namespace tamblo {

/// The process's one reporting server queue, made at first use: all session work runs on it, one piece
/// at a time. Any thread.
[[nodiscard]] SerialQueue& ZRReportingUtilityGetReportingServerQueue();
/// Finishes and drops the queue; the next use makes one of the platform installed by then. Only while nobody
/// uses it.
void resetReportingServerQueue();

} // namespace tamblo
