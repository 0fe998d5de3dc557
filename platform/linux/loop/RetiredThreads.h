#pragma once

#include "platform/linux/loop/LinuxRepeatingTimer.h"

#include <atomic>
#include <condition_variable>
#include <memory>
#include <mutex>
#include <thread>
#include <utility>
#include <vector>

namespace tamblo {

/// What a timer and its thread share.
struct LinuxRepeatingTimer::State {
    State(std::chrono::milliseconds every, UniqueFunction<void()> call)
        : interval(every), tick(std::move(call)) {}

    const std::chrono::milliseconds interval;
    UniqueFunction<void()> tick;
    std::atomic<bool> hasReturned{false};
    std::mutex mutex;
    std::condition_variable isEnding;
    bool isInvalid = false;
};

class LinuxRepeatingTimer::Retired {
public:
    ~Retired() {
        join([](const State&) { return true; });
    }

    void add(std::thread thread, std::shared_ptr<State> state) {
        const std::lock_guard lock(mutex_);
        threads_.push_back({std::move(thread), std::move(state)});
    }
    /// Joins those that have nothing left to do, without waiting.
    void joinReturned() {
        join([](const State& state) { return state.hasReturned.load(); });
    }

private:
    struct Entry {
        std::thread thread;
        std::shared_ptr<State> state;
    };

    template <typename Condition> void join(const Condition& condition) {
        const std::lock_guard lock(mutex_);
        std::erase_if(threads_, [&condition](Entry& entry) {
            const bool isDue = condition(*entry.state);
            if (isDue) {
                entry.thread.join();
            }
            return isDue;
        });
    }

    std::mutex mutex_;
    std::vector<Entry> threads_;
};

} // namespace tamblo
