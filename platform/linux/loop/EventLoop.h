#pragma once

#include "base/Mutex.h"
#include "base/UniqueFunction.h"
#include "os/FileDescriptor.h"

#include <chrono>
#include <cstdint>
#include <map>
#include <span>
#include <utility>
#include <vector>

struct epoll_event;

namespace tamblo {

class LinuxWorkQueues;

/// Something with a file descriptor that the loop watches.
class EventSource {
public:
    virtual ~EventSource() = default;
    /// On the loop's thread, with the epoll events that are up.
    virtual void ready(std::uint32_t events) = 0;
    /// Whether it is served before the others of the same wake-up.
    [[nodiscard]] virtual bool comesFirst() const noexcept { return false; }
};

/// The I/O thread's loop over epoll: one per process, run by the thread that calls `run`.
///
/// A wake-up goes in this order, and each step relies on those before it:
/// 1. sources that come first. They steer the service (preferences, notifications), so that a preference
///    written before a message was sent is in force for that message;
/// 2. the other sources; then the turns of what they have found to do: connections are read and decoded, for
///    a few milliseconds, and what they post to the queues is collected;
/// 3. the quick part of what was collected runs for a few milliseconds, here, or within step 2 as soon as 256
///    requests are there: one frame costs one wake-up, not two, and a batch shares one write of the sinks and
///    one send of the replies;
/// 4. tasks: what other threads, or the sources themselves, want done once no source of this wake-up is
///    looked at any more, such as the end of a connection;
/// 5. the delayed tasks whose time has come.
///
/// Nothing here may block: every client waits for it. What may block is left to the pool in step 3. What the
/// turns and the queues leave for want of time is gone on with in the next wake-up, which comes at once, with
/// whatever else has happened. Otherwise the loop sleeps, without a time-out unless a task is delayed.
///
/// The loop owns no source. Whoever does takes the descriptor out before closing it, and lets the source go
/// in a task, since the events of a wake-up may name it until then. A descriptor that the kernel refuses to
/// watch would never be heard of again: `add` says so, and its user gives it up. Changing and removing what
/// is watched cannot fail, unless by a mistake here.
class EventLoop {
public:
    using Task = UniqueFunction<void()>;
    /// `epoll_ctl`, or what a test has in its place.
    using Control = int (*)(int epoll, int operation, int descriptor, epoll_event* event);

    EventLoop();
    explicit EventLoop(Control calls);
    EventLoop(const EventLoop&) = delete;
    EventLoop& operator=(const EventLoop&) = delete;
    /// False when the kernel refused what it needs; nothing else may be called then.
    [[nodiscard]] bool isOpen() const noexcept { return isOpen_; }

    // From any thread, for a descriptor that stays open meanwhile.
    /// False, with the reason in `errno`, when the kernel refuses; the descriptor is not watched then.
    [[nodiscard]] bool add(int descriptor, std::uint32_t events, EventSource& source);
    void modify(int descriptor, std::uint32_t events, EventSource& source);
    void remove(int descriptor);

    /// Runs a task on the loop's thread, in the current or the next wake-up. From any thread.
    void post(Task task) TAMBLO_EXCLUDES(mutex_);
    /// Runs a task once its time has come. On the loop's thread.
    void callAfter(std::chrono::milliseconds delay, Task task);
    /// The turns of step 2, which answer whether some are left. Before the loop runs.
    void setTurns(UniqueFunction<bool()> turns) { turns_ = std::move(turns); }

    /// Returns after `stop`, which is called on the loop's thread. Lends its thread to the strands.
    void run(LinuxWorkQueues& strands);
    void stop() noexcept { isStopped_ = true; }
    /// Lets go of the tasks that have not run, and of what these hold. Once the loop has ended.
    void dropTasks() TAMBLO_EXCLUDES(mutex_);

private:
    using Deadline = std::chrono::steady_clock::time_point;

    [[nodiscard]] bool control(int operation, int descriptor, std::uint32_t events, EventSource* source);
    [[nodiscard]] int timeout() const noexcept;
    void serve(std::span<const epoll_event> events);
    void runTasks() TAMBLO_EXCLUDES(mutex_);
    void runDelayed();

    const Control control_;
    FileDescriptor epoll_;
    FileDescriptor wakeUp_;
    bool isOpen_ = false;
    bool isStopped_ = false;
    std::multimap<Deadline, Task> delayed_;
    UniqueFunction<bool()> turns_;

    Mutex mutex_;
    std::vector<Task> tasks_ TAMBLO_GUARDED_BY(mutex_);
};

} // namespace tamblo
