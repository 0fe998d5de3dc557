#pragma once

#include "tests/fakes/FakeSerialQueue.h"

#include <chrono>
#include <cstddef>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo {

/// Makes queues and delayed calls that a test runs by hand, and finds them again.
class FakeWorkQueues final : public WorkQueues {
public:
    [[nodiscard]] std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view label) override;
    [[nodiscard]] std::unique_ptr<DelayedCall> callAfter(std::chrono::milliseconds delay,
                                                         UniqueFunction<void()> call) override;

    /// Runs the queues of this label, destroyed ones too, until nothing is left for them to do; the number of
    /// pieces.
    std::size_t run(std::string_view label);
    /// How many queues of this label were made.
    [[nodiscard]] std::size_t made(std::string_view label) const;
    /// Runs every queue, and makes every delayed call, until nothing is left: nothing holds what it needs any
    /// more.
    void workOff() override;

    /// Turns the time of the delayed calls, and makes those that are due.
    void elapse(std::chrono::milliseconds time);
    [[nodiscard]] std::size_t delayedCalls() const;

private:
    struct Delayed {
        std::chrono::milliseconds due;
        UniqueFunction<void()> call; ///< empty once it is made or called off
    };
    class FakeDelayedCall final : public DelayedCall {
    public:
        explicit FakeDelayedCall(std::shared_ptr<Delayed> call) : call_(std::move(call)) {}
        ~FakeDelayedCall() override { call_->call = {}; }

    private:
        const std::shared_ptr<Delayed> call_;
    };

    struct Queue {
        std::string label;
        std::shared_ptr<FakeStrand> strand;
    };
    [[nodiscard]] std::vector<Queue> queues() const;

    mutable std::mutex mutex_;
    std::vector<Queue> queues_;
    std::chrono::milliseconds elapsed_{0};
    std::vector<std::shared_ptr<Delayed>> delayed_;
};

} // namespace tamblo
