#include "tests/fakes/FakeWorkQueues.h"

#include <algorithm>
#include <utility>

namespace tamblo {

std::unique_ptr<RepeatingTimer> FakeWorkQueues::makeRepeatingTimer(std::chrono::milliseconds interval,
                                                                   UniqueFunction<void()> tick) {
    auto state = std::make_shared<FakeRepeatingTimer::State>();
    state->interval = interval;
    state->tick = std::move(tick);
    const std::lock_guard held(mutex_);
    timers_.push_back(state);
    return std::make_unique<FakeRepeatingTimer>(std::move(state));
}

std::vector<std::shared_ptr<FakeRepeatingTimer::State>> FakeWorkQueues::timers() const {
    const std::lock_guard held(mutex_);
    return timers_;
}

std::size_t FakeWorkQueues::runningTimers() const {
    const auto all = timers();
    return static_cast<std::size_t>(
        std::count_if(all.begin(), all.end(), [](const auto& timer) { return timer->isRunning.load(); }));
}

void FakeWorkQueues::tick() {
    for (const auto& timer : timers()) {
        if (timer->isRunning) {
            timer->tick();
        }
    }
}

} // namespace tamblo
