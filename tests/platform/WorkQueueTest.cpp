#include "platform/linux/loop/LinuxWorkQueues.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cctype>
#include <chrono>
#include <filesystem>
#include <future>
#include <latch>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

namespace tamblo {
namespace {

constexpr std::chrono::seconds kPatience{20};

/// Waits for everything posted before.
void settle(SerialQueue& queue) {
    std::promise<void> done;
    queue.post([&done] { done.set_value(); });
    ASSERT_EQ(done.get_future().wait_for(kPatience), std::future_status::ready);
}

/// The letters of the pieces that ran: as they are on the test's own thread, else as capitals.
class Trace {
public:
    void add(char letter) {
        const std::lock_guard lock(mutex_);
        text_ += static_cast<char>(std::this_thread::get_id() == me_ ? letter : std::toupper(letter));
    }
    [[nodiscard]] auto step(char letter) {
        return [this, letter] { add(letter); };
    }
    [[nodiscard]] std::string text() const {
        const std::lock_guard lock(mutex_);
        return text_;
    }

private:
    const std::thread::id me_ = std::this_thread::get_id();
    mutable std::mutex mutex_;
    std::string text_;
};

TEST(SerialQueue, RunsWorkOfManyThreadsOneAtATimeInTheirOrderHoweverOftenItIsSuspended) {
    LinuxWorkQueues queues;
    const auto queue = queues.makeSerialQueue("order");
    constexpr int kEach = 2000;
    std::vector<std::vector<int>> seen(4); // unguarded: the queue is the guard
    std::vector<std::jthread> threads;
    for (std::vector<int>& mine : seen) {
        threads.emplace_back([&queue, &mine] {
            for (int i = 0; i < kEach; ++i) {
                queue->post([&mine, i] { mine.push_back(i); }, i % 100 == 0 ? Pace::mayBlock : Pace::quick);
            }
        });
    }
    threads.emplace_back([&queue] {
        for (int i = 0; i < kEach; ++i) {
            queue->suspend();
            std::this_thread::yield();
            queue->resume();
        }
    });
    threads.clear();
    settle(*queue);
    for (const std::vector<int>& ofThread : seen) {
        ASSERT_EQ(ofThread.size(), static_cast<std::size_t>(kEach));
        EXPECT_TRUE(std::is_sorted(ofThread.begin(), ofThread.end()));
    }
}

TEST(SerialQueue, QuickWorkIsDrainedByThePosterInOneBatch) {
    Trace trace;
    LinuxWorkQueues queues;
    const auto queue = queues.makeSerialQueue("inline");
    queue->setBatchEnd(trace.step('|'));
    queues.setRunEnd(trace.step('.'));
    queues.beginWakeUp();
    queue->post([&] {
        trace.add('a');
        queue->post(trace.step('c'));
    });
    queue->post(trace.step('b'));
    EXPECT_EQ(trace.text(), "");
    queues.endWakeUp();
    EXPECT_EQ(trace.text(), "ab|c|.");
}

TEST(SerialQueue, WorkThatMayBlockLeavesThePosterAndTakesWhatFollowsAlong) {
    LinuxWorkQueues queues;
    for (const bool mayAllBlock : {false, true}) {
        const auto queue = queues.makeSerialQueue("hand over");
        Trace trace;
        std::latch mayGoOn(1);
        queues.beginWakeUp();
        queue->post([&] {
            trace.add('a');
            queue->setMayBlock(mayAllBlock); // even what is posted already
        });
        queue->post(
            [&] {
                mayGoOn.wait();
                trace.add('b');
            },
            mayAllBlock ? Pace::quick : Pace::mayBlock);
        queue->post(trace.step('c'));
        queues.endWakeUp(); // returns although b has not run
        mayGoOn.count_down();
        settle(*queue);
        EXPECT_EQ(trace.text(), "aBC");
    }
}

TEST(SerialQueue, ManyQueuesShareFewThreadsThatGrowWhileWorkBlocks) {
    LinuxWorkQueues queues;
    constexpr std::size_t kBlocked = 8;
    std::latch allBlocked(kBlocked);
    std::latch mayGoOn(1);
    std::atomic<int> ran{0};
    std::vector<std::unique_ptr<SerialQueue>> many;
    for (std::size_t i = 0; i < 10'000; ++i) {
        many.push_back(queues.makeSerialQueue("one of many"));
        many.back()->post([&, isBlocked = i < kBlocked] {
            if (isBlocked) {
                allBlocked.count_down();
                mayGoOn.wait();
            }
            ++ran;
        });
    }
    allBlocked.wait();
    settle(*many.back());
    const std::filesystem::directory_iterator threads("/proc/self/task");
    EXPECT_LE(std::distance(threads, {}), static_cast<std::ptrdiff_t>(ThreadPool::kMaximumThreads) + 4);
    mayGoOn.count_down();
    queues.workOff();
    EXPECT_EQ(ran, 10'000);
}

TEST(SerialQueue, WhatWasPostedRunsAfterItIsDestroyed) {
    std::atomic<int> ran{0};
    {
        LinuxWorkQueues queues;
        auto queue = queues.makeSerialQueue("last words");
        for (int i = 0; i < 1000; ++i) {
            queue->post([&ran] { ++ran; }, i % 2 == 0 ? Pace::quick : Pace::mayBlock);
        }
        queue.reset();

        // In its own work, and on the thread that is to drain it.
        queue = queues.makeSerialQueue("suicide");
        queues.beginWakeUp();
        queue->post([&] { queue.reset(); });
        queue->post([&ran] { ++ran; });
        auto other = queues.makeSerialQueue("abandoned");
        other->post([&ran] { ++ran; });
        other.reset();
        queues.endWakeUp();
        EXPECT_EQ(queue, nullptr);
    }
    EXPECT_EQ(ran, 1002);
}

TEST(SerialQueue, RunsNothingWhileItIsSuspendedAndAllOfItAfterwards) {
    LinuxWorkQueues queues;
    for (const bool isInline : {true, false}) {
        auto queue = queues.makeSerialQueue("suspended");
        Trace trace;
        std::promise<void> suspended;
        queue->setBatchEnd([&, isFirst = true]() mutable {
            if (std::exchange(isFirst, false)) {
                suspended.set_value();
            }
        });
        if (isInline) {
            queues.beginWakeUp();
        }
        queue->post([&] {
            queue->suspend();
            queue->suspend();
            trace.add('a');
        });
        queue->post(trace.step('b')); // as a rule of the same batch
        queues.endWakeUp();
        ASSERT_EQ(suspended.get_future().wait_for(kPatience), std::future_status::ready);
        queue->post(trace.step('c'), Pace::mayBlock);
        auto other = queues.makeSerialQueue("other");
        settle(*other);
        EXPECT_EQ(trace.text(), isInline ? "a" : "A");
        other->post([&] { queue->resume(); });
        settle(*other);
        settle(*queue);
        EXPECT_EQ(trace.text(), isInline ? "aBC" : "ABC");

        queue->resume(); // of a queue that runs
        queue->suspend();
        std::promise<void> done;
        queue->post([&done] { done.set_value(); });
        queue.reset();
        EXPECT_EQ(done.get_future().wait_for(kPatience), std::future_status::ready);
    }
}

TEST(DelayedCall, IsMadeOnceItsTimeHasComeUnlessItIsCalledOff) {
    LinuxWorkQueues queues;
    using std::chrono::milliseconds;
    const auto start = std::chrono::steady_clock::now();
    std::promise<void> late;
    std::atomic<bool> isSoonMade{false};
    std::atomic<bool> isCalledOffMade{false};
    const auto lateCall = queues.callAfter(milliseconds(60), [&late] { late.set_value(); });
    auto calledOff = queues.callAfter(milliseconds(30), [&] { isCalledOffMade = true; });
    const auto soonCall = queues.callAfter(milliseconds(10), [&] { isSoonMade = true; });
    const auto never = queues.callAfter(std::chrono::hours(24), [] { FAIL(); });
    calledOff.reset();
    // Also while the thread that waits for the time is blocked by other work.
    std::latch mayGoOn(1);
    const auto blocked = queues.makeSerialQueue("blocked");
    blocked->post([&mayGoOn] { mayGoOn.wait(); }, Pace::mayBlock);
    ASSERT_EQ(late.get_future().wait_for(kPatience), std::future_status::ready);
    EXPECT_GE(std::chrono::steady_clock::now() - start, milliseconds(60));
    EXPECT_TRUE(isSoonMade);
    EXPECT_FALSE(isCalledOffMade);
    mayGoOn.count_down();

    // Many at once, each made once.
    std::atomic<int> made{0};
    std::promise<void> allMade;
    std::vector<std::unique_ptr<DelayedCall>> calls;
    for (int i = 0; i < 2000; ++i) {
        calls.push_back(queues.callAfter(milliseconds(i % 20), [&] {
            if (++made == 2000) {
                allMade.set_value();
            }
        }));
    }
    EXPECT_EQ(allMade.get_future().wait_for(kPatience), std::future_status::ready);
}

} // namespace
} // namespace tamblo
