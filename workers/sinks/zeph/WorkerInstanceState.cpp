#include "workers/sinks/zeph/WorkerInstanceState.h"

#include <functional>
#include <map>
#include <utility>

namespace tamblo {

namespace {

struct SharedStates {
    std::mutex mutex; ///< guards what follows
    std::map<std::string, std::shared_ptr<WorkerInstanceState>, std::less<>> byClassName;
};

SharedStates& sharedStates() {
    static SharedStates states;
    return states;
}

} // namespace

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

std::shared_ptr<WorkerInstanceState>
sharedWorkerInstanceState(std::string_view detectorClassName,
                          std::shared_ptr<WorkerInstanceState> (*makeState)()) {
    SharedStates& states = sharedStates();
    const std::lock_guard lock(states.mutex);
    const auto found = states.byClassName.find(detectorClassName);
    if (found != states.byClassName.end()) {
        return found->second;
    }
    return states.byClassName.emplace(detectorClassName, makeState()).first->second;
}

void forgetSharedWorkerInstanceStates() {
    SharedStates& states = sharedStates();
    const std::lock_guard lock(states.mutex);
    states.byClassName.clear();
}

} // namespace tamblo
