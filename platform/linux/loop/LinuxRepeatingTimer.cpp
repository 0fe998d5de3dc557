#include "platform/linux/loop/LinuxRepeatingTimer.h"

#include "platform/linux/loop/RetiredThreads.h"

#include <algorithm>
#include <mutex>
#include <utility>

namespace tamblo {

void LinuxRepeatingTimer::run(State& state) {
    auto due = std::chrono::steady_clock::now() + state.interval;
    std::unique_lock lock(state.mutex);
    while (!state.isEnding.wait_until(lock, due, [&state] { return state.isInvalid; })) {
        lock.unlock();
        state.tick();
        lock.lock();
        due = std::max(due + state.interval, std::chrono::steady_clock::now());
    }
    lock.unlock();
    state.hasReturned = true;
}

LinuxRepeatingTimer::LinuxRepeatingTimer(std::chrono::milliseconds interval, UniqueFunction<void()> tick,
                                         std::shared_ptr<Retired> retired)
    : state_(std::make_shared<State>(interval, std::move(tick))), retired_(std::move(retired)) {}

LinuxRepeatingTimer::~LinuxRepeatingTimer() {
    invalidate();
    if (!thread_.joinable()) {
        return;
    }
    if (thread_.get_id() == std::this_thread::get_id()) {
        retired_->add(std::move(thread_), state_);
    } else {
        thread_.join();
    }
}

void LinuxRepeatingTimer::start() {
    // The thread waits for this lock first: a tick that drops the timer finds the thread in its place.
    const std::lock_guard lock(state_->mutex);
    thread_ = std::thread([state = state_] { run(*state); });
}

void LinuxRepeatingTimer::invalidate() {
    {
        const std::lock_guard lock(state_->mutex);
        state_->isInvalid = true;
    }
    state_->isEnding.notify_all();
}

} // namespace tamblo
