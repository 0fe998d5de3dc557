#pragma once

#include "platform/WorkQueue.h"

#include <chrono>
#include <memory>
#include <thread>

namespace tamblo {

/// A repeating timer with a thread of its own, from `start` until it is invalidated.
class LinuxRepeatingTimer final : public RepeatingTimer {
public:
    /// Threads that could not be joined where their timer ended, since the timer was dropped by its own tick.
    class Retired;

    LinuxRepeatingTimer(std::chrono::milliseconds interval, UniqueFunction<void()> tick,
                        std::shared_ptr<Retired> retired);
    ~LinuxRepeatingTimer() override;
    void start() override;
    void invalidate() override;

private:
    struct State;

    static void run(State& state);

    std::shared_ptr<State> state_;
    std::shared_ptr<Retired> retired_;
    std::thread thread_;
};

} // namespace tamblo
