#pragma once

#include "platform/WorkQueue.h"

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <deque>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo {

/// What is posted to a fake queue, until a test runs it on the test's thread. Outlives the queue for as long
/// as somebody runs it.
class FakeStrand {
public:
    explicit FakeStrand(std::string_view queueLabel) : label(queueLabel) {}

    void post(Work work, Pace pace) {
        const std::lock_guard held(mutex_);
        pieces_.push_back(std::move(work));
        paces_.push_back(pace);
    }
    /// Runs what is posted, and what that posts, then the batch's end; the number of pieces. Does nothing
    /// inside a piece of its own.
    std::size_t runAll() {
        std::size_t count = 0;
        while (!isRunning_ && runOne()) {
            ++count;
        }
        if (count != 0 && batchEnd) {
            batchEnd();
        }
        return count;
    }
    /// Runs one piece, without the batch's end; false when there is none, or the queue is suspended.
    bool runOne() {
        Work piece;
        {
            const std::lock_guard held(mutex_);
            if (isSuspended_ || pieces_.empty()) {
                return false;
            }
            piece = std::move(pieces_.front());
            pieces_.pop_front();
        }
        const bool wasRunning = std::exchange(isRunning_, true);
        piece();
        piece.reset();
        isRunning_ = wasRunning;
        return true;
    }
    [[nodiscard]] std::vector<Pace> takePaces() {
        const std::lock_guard held(mutex_);
        return std::exchange(paces_, {});
    }
    void setSuspended(bool isSuspended) {
        const std::lock_guard held(mutex_);
        isSuspended_ = isSuspended;
    }

    const std::string label;
    Work batchEnd;

private:
    bool isRunning_ = false;
    std::mutex mutex_;
    bool isSuspended_ = false;
    std::deque<Work> pieces_;
    std::vector<Pace> paces_;
};

/// Keeps what is posted until a test runs it, or it is destroyed.
class FakeSerialQueue final : public SerialQueue {
public:
    explicit FakeSerialQueue(std::string_view label) : FakeSerialQueue(std::make_shared<FakeStrand>(label)) {}
    explicit FakeSerialQueue(std::shared_ptr<FakeStrand> strand) : strand_(std::move(strand)) {}
    ~FakeSerialQueue() override {
        strand_->setSuspended(false);
        strand_->runAll();
    }

    void post(Work work, Pace pace) override { strand_->post(std::move(work), pace); }
    void setBatchEnd(Work batchEnd) override { strand_->batchEnd = std::move(batchEnd); }
    void setMayBlock(bool mayBlockNow) override { mayBlock = mayBlockNow; }
    void suspend() override { strand_->setSuspended(true); }
    void resume() override { strand_->setSuspended(false); }

    std::size_t runAll() { return strand_->runAll(); }
    bool runOne() { return strand_->runOne(); }
    /// The pace of each piece that was posted since the last call.
    [[nodiscard]] std::vector<Pace> takePaces() { return strand_->takePaces(); }

    bool mayBlock = false;

private:
    const std::shared_ptr<FakeStrand> strand_;
};

/// Makes queues and delayed calls that a test runs by hand, and finds them again. On one thread.
class FakeWorkQueues final : public WorkQueues {
public:
    std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view label) override {
        return std::make_unique<FakeSerialQueue>(strands_.emplace_back(std::make_shared<FakeStrand>(label)));
    }
    std::unique_ptr<DelayedCall> callAfter(std::chrono::milliseconds delay,
                                           UniqueFunction<void()> call) override {
        delayed_.push_back(std::make_shared<Delayed>(elapsed_ + delay, std::move(call)));
        return std::make_unique<FakeDelayedCall>(delayed_.back());
    }
    /// Runs every queue, and makes every delayed call, until nothing is left: nothing holds what it needs any
    /// more.
    void workOff() override {
        while (delayedCalls() + runAll([](const FakeStrand&) { return true; }) != 0) {
            elapse(std::chrono::hours(24));
        }
    }

    /// Runs the queues of this label, destroyed ones too, until nothing is left for them to do; the number of
    /// pieces.
    std::size_t run(std::string_view label) {
        return runAll([label](const FakeStrand& strand) { return strand.label == label; });
    }
    /// Turns the time of the delayed calls, and makes those that are due.
    void elapse(std::chrono::milliseconds time) {
        elapsed_ += time;
        const auto isDue = [this](const auto& entry) { return entry->due <= elapsed_; };
        const auto later = std::stable_partition(delayed_.begin(), delayed_.end(), isDue);
        const std::vector due(delayed_.begin(), later);
        delayed_.erase(delayed_.begin(), later);
        for (const auto& entry : due) {
            if (auto call = std::exchange(entry->call, {})) {
                call();
            }
        }
    }
    /// Those that come within this time.
    [[nodiscard]] std::size_t delayedCalls(std::chrono::hours within = std::chrono::hours(1000)) const {
        const auto isToCome = [latest = elapsed_ + within](const auto& entry) {
            return bool(entry->call) && entry->due <= latest;
        };
        return static_cast<std::size_t>(std::count_if(delayed_.begin(), delayed_.end(), isToCome));
    }

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

    template <typename Matches> std::size_t runAll(Matches matches) {
        std::size_t pieces = 0;
        std::size_t before = 0;
        do {
            before = pieces;
            for (std::size_t i = 0; i < strands_.size(); ++i) { // a piece may make further queues
                const std::shared_ptr<FakeStrand> strand = strands_[i];
                pieces += matches(*strand) ? strand->runAll() : 0;
            }
        } while (pieces != before);
        return pieces;
    }

    std::vector<std::shared_ptr<FakeStrand>> strands_;
    std::chrono::milliseconds elapsed_{0};
    std::vector<std::shared_ptr<Delayed>> delayed_;
};

} // namespace tamblo
