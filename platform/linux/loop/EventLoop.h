#pragma once

#include "base/Mutex.h"
#include "base/UniqueFunction.h"
#include "os/FileDescriptor.h"

#include <chrono>
#include <cstdint>
#include <optional>
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
/// 2. the other sources: connections read and decode, and what they post to the queues is collected;
/// 3. the quick part of what was collected runs, here, or within step 2 as soon as 256 requests are there:
///    one frame costs one wake-up, not two, and a batch shares one write of the sinks and one send of the
///    replies;
/// 4. tasks: what other threads, or the sources themselves, want done once no source of this wake-up is
///    looked at any more, such as the end of a connection;
/// 5. the delayed task, if its time has come.
///
/// Nothing here may block: every client waits for it. What may block is left to the pool in step 3, and a
/// source reads a bounded piece for each wake-up; what it leaves is reported again, as the watching is
/// level-triggered, behind the other sources. The loop sleeps without a time-out unless a task is delayed.
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
    /// Called on the loop's thread once the time has come, at most once; a second call moves it.
    void callAfter(std::chrono::milliseconds delay, Task task);

    /// Returns after `stop`, which is called on the loop's thread. Lends its thread to the strands.
    void run(LinuxWorkQueues& strands);
    void stop() noexcept { isStopped_ = true; }

private:
    using Deadline = std::chrono::steady_clock::time_point;

    [[nodiscard]] bool control(int operation, int descriptor, std::uint32_t events, EventSource* source);
    [[nodiscard]] int timeout() const noexcept;
    void runTasks() TAMBLO_EXCLUDES(mutex_);
    void runDelayed();

    const Control control_;
    FileDescriptor epoll_;
    FileDescriptor wakeUp_;
    bool isOpen_ = false;
    bool isStopped_ = false;
    std::optional<Deadline> deadline_;
    Task delayed_;

    Mutex mutex_;
    std::vector<Task> tasks_ TAMBLO_GUARDED_BY(mutex_);
};

} // namespace tamblo
