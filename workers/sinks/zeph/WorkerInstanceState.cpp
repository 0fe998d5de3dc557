#include "workers/sinks/zeph/WorkerInstanceState.h"

#include <utility>

namespace tamblo {

bool WorkerInstanceState::isDue(WallTime now) const noexcept {
    if (interestedCount < interestThresholdCount) {
        return false;
    }
    if (interestThresholdCount == 0 &&
        now - interestFirstSeen.value_or(now) <= interestThresholdDurationSeconds) {
        return false;
    }
    return firedCount == 0 || !oncePerSession;
}

void WorkerInstanceState::resetInterest() noexcept {
    lastMessage.reset();
    interestFirstSeen.reset();
    interestedCount = 0;
}

std::optional<std::string> WorkerInstanceState::currentZephSessionIdentifier() const {
    const std::lock_guard lock(mutex_);
    return currentZephSessionIdentifier_;
}

void WorkerInstanceState::setCurrentZephSessionIdentifier(std::string identifier) {
    const std::lock_guard lock(mutex_);
    currentZephSessionIdentifier_ = std::move(identifier);
}

} // namespace tamblo
