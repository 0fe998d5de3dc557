#include "tests/fakes/FakeWorkQueues.h"

#include <algorithm>
#include <utility>

namespace tamblo {

std::unique_ptr<RepeatingTimer> FakeWorkQueues::makeRepeatingTimer(std::chrono::milliseconds interval,
                                                                   UniqueFunction<void()> tick) {
    auto state = std::make_shared<FakeRepeatingTimer::State>();
    state->interval = interval;
    state->tick = std::move(tick);
    timers_.push_back(state);
    return std::make_unique<FakeRepeatingTimer>(std::move(state));
}

std::size_t FakeWorkQueues::runningTimers() const noexcept {
    return static_cast<std::size_t>(
        std::count_if(timers_.begin(), timers_.end(), [](const auto& timer) { return timer->isRunning; }));
}

void FakeWorkQueues::tick() {
    const auto timers = timers_;
    for (const auto& timer : timers) {
        if (timer->isRunning) {
            timer->tick();
        }
    }
}

} // namespace tamblo
