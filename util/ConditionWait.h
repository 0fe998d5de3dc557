#pragma once

#include "base/Mutex.h"
#include "util/LogCategories.h"

#include <chrono>
#include <condition_variable>
#include <string_view>

namespace tamblo {

/// The lock of a one-shot handshake between two threads; guards the flag that says it is done.
struct ConditionLock {
    Mutex mutex;
    std::condition_variable condition;
};

/// Waits until the flag is set; false when it is not set in time. Every wake-up begins the timeout anew.
/// Writes the waiting message before each wait and the timeout message when it gives up.
[[nodiscard]] bool ZRReportingUtilityWait(ConditionLock& lock, std::chrono::duration<double> timeout,
                                          const bool& flag, std::string_view waitingMessage,
                                          std::string_view timeoutMessage, const LogCategory& category);
/// Sets the flag and wakes one that waits for it.
void ZRReportingUtilitySignal(ConditionLock& lock, bool& flag);

} // namespace tamblo
