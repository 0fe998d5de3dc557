#include "platform/linux/Health.h"
#include "platform/linux/connections/LinuxConnectionService.h"
#include "platform/linux/loop/LinuxWorkQueues.h"
#include "tests/Sockets.h"
#include "tests/fakes/FakeWorkQueues.h"
#include "tests/platform/LinuxServiceSupport.h"
#include "wire/Protocol.h"

#include <array>
#include <cctype>
#include <future>
#include <latch>
#include <thread>

#include <sys/epoll.h>

namespace tamblo {
namespace {

using namespace testing;
using std::chrono::milliseconds;

/// The letters of the pieces that ran: as they are on the test's own thread, else as capitals. Of one queue,
/// which is its guard.
class Trace {
public:
    auto step(char letter) {
        return [this, letter] {
            text += static_cast<char>(std::this_thread::get_id() == me_ ? letter : std::toupper(letter));
        };
    }
    std::string text;

private:
    const std::thread::id me_ = std::this_thread::get_id();
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
    queues.workOff();
    for (const std::vector<int>& ofThread : seen) {
        EXPECT_EQ(ofThread.size(), static_cast<std::size_t>(kEach));
        EXPECT_TRUE(std::ranges::is_sorted(ofThread));
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
        trace.step('a')();
        queue->post(trace.step('c'));
    });
    queue->post(trace.step('b'));
    EXPECT_EQ(trace.text, "");
    queues.endWakeUp();
    EXPECT_EQ(trace.text, "ab|c|.");
}

TEST(SerialQueue, WorkThatMayBlockLeavesThePosterAndTakesWhatFollowsAlong) {
    LinuxWorkQueues queues;
    for (const bool mayAllBlock : {false, true}) {
        const auto queue = queues.makeSerialQueue("hand over");
        Trace trace;
        std::latch mayGoOn(1);
        queues.beginWakeUp();
        queue->post([&] {
            trace.step('a')();
            queue->setMayBlock(mayAllBlock); // even what is posted already
        });
        queue->post([&] { mayGoOn.wait(); }, mayAllBlock ? Pace::quick : Pace::mayBlock);
        queue->post(trace.step('b'));
        queues.endWakeUp(); // returns although the second waits
        mayGoOn.count_down();
        queues.workOff();
        EXPECT_EQ(trace.text, "aB");
    }
}

TEST(SerialQueue, WhatWasPostedRunsAfterItIsDestroyed) {
    std::atomic<int> ran{0};
    {
        LinuxWorkQueues queues;
        auto queue = queues.makeSerialQueue("last words");
        for (int i = 0; i < 1000; ++i) {
            queue->post([&ran] { ++ran; }, i % 2 == 0 ? Pace::quick : Pace::mayBlock);
        }
        // In its own work, and on the thread that is to drain it.
        queue = queues.makeSerialQueue("suicide");
        queues.beginWakeUp();
        queue->post([&] { queue.reset(); });
        queue->post([&ran] { ++ran; });
        queues.makeSerialQueue("abandoned")->post([&ran] { ++ran; });
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
        if (isInline) {
            queues.beginWakeUp();
        }
        queue->post([&] {
            queue->suspend();
            queue->suspend();
            trace.step('a')();
        });
        queue->post(trace.step('b')); // as a rule of the same batch
        queues.endWakeUp();
        queues.workOff();
        queue->post(trace.step('c'), Pace::mayBlock);
        queues.workOff();
        EXPECT_EQ(trace.text, isInline ? "a" : "A");
        queue->resume();
        queues.workOff();
        EXPECT_EQ(trace.text, isInline ? "aBC" : "ABC");

        queue->resume(); // of a queue that runs
        queue->suspend();
        queue->post(trace.step('d'));
        queue.reset();
        queues.workOff();
        EXPECT_EQ(trace.text.back(), 'D');
    }
}

TEST(SerialQueue, WorkIsItsPostersClientsWhereverItRuns) {
    LinuxWorkQueues queues;
    const auto queue = queues.makeSerialQueue("origin");
    std::vector<pid_t> seen; // unguarded: the queue is the guard
    const auto note = [&seen] { seen.push_back(LogOrigin::client().value_or(ClientIdentity{}).process); };
    std::promise<void> called;
    std::unique_ptr<DelayedCall> call;
    queues.beginWakeUp();
    {
        const LogOrigin origin(ClientIdentity{1000, 7});
        queue->post(note);
        queue->post([&] { queue->post(note, Pace::mayBlock); });
        call = queues.callAfter(milliseconds(0), [&] {
            called.set_value();
            queue->post(note);
        });
    }
    queue->post(note);
    queues.endWakeUp();
    called.get_future().wait();
    queues.workOff();
    EXPECT_THAT(seen, UnorderedElementsAre(7, 7, 7, 0));
}

TEST(DelayedCall, IsMadeOnceItsTimeHasComeUnlessItIsCalledOff) {
    LinuxWorkQueues queues;
    const auto start = std::chrono::steady_clock::now();
    std::promise<void> late;
    std::atomic<bool> isSoonMade{false};
    const auto lateCall = queues.callAfter(milliseconds(60), [&late] { late.set_value(); });
    auto calledOff = queues.callAfter(milliseconds(30), [] { ADD_FAILURE() << "it was called off"; });
    const auto soonCall = queues.callAfter(milliseconds(10), [&] { isSoonMade = true; });
    const auto never = queues.callAfter(std::chrono::hours(24), [] { ADD_FAILURE() << "too early"; });
    calledOff.reset();
    // Also while the thread that waits for the time is blocked by other work.
    std::latch mayGoOn(1);
    const auto blocked = queues.makeSerialQueue("blocked");
    blocked->post([&mayGoOn] { mayGoOn.wait(); }, Pace::mayBlock);
    ASSERT_EQ(late.get_future().wait_for(std::chrono::seconds(20)), std::future_status::ready);
    EXPECT_GE(std::chrono::steady_clock::now() - start, milliseconds(60));
    EXPECT_TRUE(isSoonMade);
    mayGoOn.count_down();
}

TEST(Health, GivesASignOnceTheQueueHasGotToItAndTellsWhatIsNew) {
    const TemporaryDirectory directory;
    const FileDescriptor manager(test::boundSocket(SOCK_DGRAM, directory.path("notify")));
    const auto told = [&manager] {
        std::array<char, 64> text{};
        (void)(isReadable(manager.get(), 20'000) && ::recv(manager.get(), text.data(), text.size() - 1, 0));
        return std::string(text.data());
    };
    ::setenv("NOTIFY_SOCKET", directory.path("notify").c_str(), 1);
    ::setenv("WATCHDOG_USEC", "2000", 1);
    EventLoop loop;
    std::atomic<int> state{1};
    Health health(loop, [&state] { return std::to_string(state); });
    LinuxWorkQueues queues;
    FakeSerialQueue queue("server");
    const auto sign = [&] { // asked for by the loop a millisecond after the last one
        for (int i = 0; i < 20'000 && !queue.runOne(); ++i) {
            std::this_thread::sleep_for(milliseconds(1));
        }
        return told();
    };
    health.watch(queue);
    std::thread thread([&] { loop.run(queues); });
    EXPECT_EQ(told(), "STATUS=1") << "no sign in the second before, as the queue got to nothing";
    EXPECT_EQ(sign(), "WATCHDOG=1");
    EXPECT_EQ(sign(), "WATCHDOG=1");
    state = 2;
    EXPECT_EQ(sign(), "STATUS=2");
    EXPECT_EQ(told(), "WATCHDOG=1");
    EXPECT_EQ(sign(), "WATCHDOG=1");
    loop.post([&loop] { loop.stop(); });
    thread.join();
    ::unsetenv("NOTIFY_SOCKET");
    ::unsetenv("WATCHDOG_USEC");
}

std::atomic<int> additions{0};

/// The kernel, but for every second addition, which it refuses as if the user had no watches left.
int refusingControl(int epoll, int operation, int descriptor, epoll_event* event) {
    if (operation == EPOLL_CTL_ADD && ++additions % 2 == 0) {
        errno = ENOSPC;
        return -1;
    }
    return ::epoll_ctl(epoll, operation, descriptor, event);
}

struct Delegate final : ListenerDelegate {
    bool shouldAcceptNewConnection(ClientConnection& connection) override {
        connection.setInvalidationHandler([this] { ++ended; });
        connection.resume();
        return true;
    }
    std::atomic<int> ended{0};
};

TEST(ConnectionService, EndsAClientWhoseSocketCannotBeWatchedAndServesTheOthers) {
    const TemporaryDirectory directory;
    const sockaddr_un address = test::addressOf(wire::socketPath(directory.path()));
    const FileDescriptor unwatched(::socket(AF_UNIX, SOCK_STREAM, 0));
    const FileDescriptor other(::socket(AF_UNIX, SOCK_STREAM, 0));
    FakeLog log;
    additions = 0;
    EventLoop loop(refusingControl);
    const FakeClock clock;
    const Limits limits;
    LinuxConnectionService service(loop, clock, log, limits);
    loop.setTurns([&] { return service.readSome(); });
    LinuxWorkQueues queues;
    const auto requests = queues.makeSerialQueue("requests");
    Delegate delegate;
    service.setServerQueue(*requests, queues);
    service.setDelegate(delegate);
    ASSERT_EQ(service.open(directory.path()), std::nullopt);
    service.resume(); // nor can the listener's own socket, for a moment
    std::thread thread([&] { loop.run(queues); });
    for (const FileDescriptor* client : {&unwatched, &other}) {
        ::connect(client->get(), reinterpret_cast<const sockaddr*>(&address), sizeof address);
    }
    EXPECT_TRUE(isReadable(unwatched.get(), 20'000)) << "that it has ended";
    ::send(other.get(), "\x01\0\0\0\xA0", 5, MSG_NOSIGNAL);
    EXPECT_TRUE(isReadable(other.get(), 20'000)) << "an answer: that this is no request";
    EXPECT_THAT(service.clientProcesses(), ElementsAre(::getpid()));
    loop.post([&] {
        service.stop();
        loop.stop();
    });
    thread.join();
    EXPECT_EQ(delegate.ended, 1);
    EXPECT_THAT(log.take(), ElementsAre("3 zrrs accepting connections rests: No space left on device",
                                        "3 zrrs accepting connections again",
                                        HasSubstr("since its socket cannot be watched: No space left on")));
}

} // namespace
} // namespace tamblo
