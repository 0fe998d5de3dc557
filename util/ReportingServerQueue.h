#pragma once

#include "platform/WorkQueue.h"

namespace tamblo {

/// The process's one reporting server queue, made at first use: all session work runs on it, one piece
/// at a time. Any thread.
[[nodiscard]] SerialQueue& ZRReportingUtilityGetReportingServerQueue();
/// Finishes and drops the queue, and messages are quick again; the next use makes one of the platform
/// installed by then. Only while nobody uses it.
void resetReportingServerQueue();

/// The pace at which a client's message goes to the queue: quick, as long as no worker says otherwise. Any
/// thread.
[[nodiscard]] Pace paceOfMessages() noexcept;
/// Whether, from now on, a worker may hold up the queue in the middle of a message: no thread that must stay
/// responsive then runs it. Any thread.
void setMessagesMayBlock(bool mayBlock) noexcept;

} // namespace tamblo
