#pragma once

#include "base/UniqueFunction.h"
#include "os/FileDescriptor.h"

#include <chrono>
#include <cstdint>
#include <mutex>
#include <optional>
#include <vector>

namespace tamblo {

/// Something with a file descriptor that the loop watches.
class EventSource {
public:
    virtual ~EventSource() = default;
    /// On the loop's thread, with the epoll events that are up.
    virtual void ready(std::uint32_t events) = 0;
    /// Whether it is served before the others of the same wake-up: what steers the service is read before
    /// what uses it, so that a preference written before a message was sent is in force for that message.
    [[nodiscard]] virtual bool comesFirst() const noexcept { return false; }
};

/// The I/O thread's loop over epoll: one per process, run by the thread that calls `run`. It sleeps without a
/// time-out unless somebody asked to be called at a time.
class EventLoop {
public:
    using Task = UniqueFunction<void()>;

    EventLoop();
    ~EventLoop();
    EventLoop(const EventLoop&) = delete;
    /// False when the kernel refused the descriptors that it needs; nothing else may be called then.
    [[nodiscard]] bool isOpen() const noexcept { return epoll_.isOpen() && wakeUp_.isOpen(); }
    EventLoop& operator=(const EventLoop&) = delete;

    /// From any thread, for a descriptor that stays open meanwhile. Level-triggered.
    void add(int descriptor, std::uint32_t events, EventSource& source);
    void modify(int descriptor, std::uint32_t events, EventSource& source);
    void remove(int descriptor);

    /// Runs a task on the loop's thread, after the sources of the current or next wake-up. From any thread.
    void post(Task task);
    /// Called on the loop's thread once the time has come, at most once; a second call moves it.
    void callAfter(std::chrono::milliseconds delay, Task task);
    /// Called on the loop's thread around the sources of each wake-up.
    void setBrackets(Task before, Task after);

    /// Returns after `stop`, which is called on the loop's thread.
    void run();
    void stop() noexcept { isStopped_ = true; }

private:
    using Deadline = std::chrono::steady_clock::time_point;

    void wake() noexcept;
    [[nodiscard]] int timeout() const noexcept;
    void runTasks();
    void runDelayed();

    FileDescriptor epoll_;
    FileDescriptor wakeUp_;
    Task before_;
    Task after_;
    bool isStopped_ = false;
    std::optional<Deadline> deadline_;
    Task delayed_;
    std::mutex mutex_; ///< guards what follows
    std::vector<Task> tasks_;
};

} // namespace tamblo
