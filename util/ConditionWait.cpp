#include "util/ConditionWait.h"

#include "util/Log.h"

#include <algorithm>

namespace tamblo {

namespace {

/// Longer is for ever; more would not fit a point of time.
constexpr std::chrono::duration<double> kLongestWait = std::chrono::hours(24 * 365);

} // namespace

bool ZRReportingUtilityWait(ConditionLock& lock, std::chrono::duration<double> timeout, const bool& flag,
                            std::string_view waitingMessage, std::string_view timeoutMessage,
                            const LogCategory& category) {
    const auto wait = std::chrono::duration_cast<std::chrono::nanoseconds>(
        std::clamp(timeout, std::chrono::duration<double>::zero(), kLongestWait));
    MutexLock held(lock.mutex);
    while (!flag) {
        log::info(category, "{}", waitingMessage);
        if (lock.condition.wait_for(held.forWaiting(), wait) == std::cv_status::timeout) {
            log::error(category, "{}", timeoutMessage);
            return false;
        }
        log::info(category, "continuing");
    }
    return true;
}

void ZRReportingUtilitySignal(ConditionLock& lock, bool& flag) {
    const MutexLock held(lock.mutex);
    flag = true;
    lock.condition.notify_one();
}

} // namespace tamblo
