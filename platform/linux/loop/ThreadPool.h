#pragma once

#include "platform/WorkQueue.h"

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <mutex>
#include <thread>
#include <utility>
#include <vector>

namespace tamblo {

/// Threads for work that may block, and for calls at a later time. The pool starts empty, grows while every
/// thread is busy, up to a limit, and a thread that finds nothing to do for some seconds ends, but for
/// one while a call is to come: an idle process has none. The destructor works off what was posted; calls
/// whose time has not come are dropped.
class ThreadPool {
public:
    static constexpr std::size_t kMaximumThreads = 16;
    using Time = std::chrono::steady_clock::time_point;
    /// Names a delayed call: when it is due, and which of those of that time.
    using DelayedKey = std::pair<Time, std::uint64_t>;

    ThreadPool() = default;
    ~ThreadPool();
    ThreadPool(const ThreadPool&) = delete;
    ThreadPool& operator=(const ThreadPool&) = delete;

    void post(UniqueFunction<void()> work);
    [[nodiscard]] DelayedKey postAfter(std::chrono::milliseconds delay, UniqueFunction<void()> work);
    /// Nothing when the call has begun.
    void cancel(const DelayedKey& key);
    /// Returns when there is no work left; delayed calls that have not begun are dropped. Not from work.
    void workOff();

private:
    void run();
    /// With the lock held: sees to it that somebody will take the work.
    void callThread();
    void takeDueCalls();
    [[nodiscard]] bool waitForWork(std::unique_lock<std::mutex>& lock);
    void joinFinished();

    std::mutex mutex_; ///< guards what follows
    std::condition_variable hasWork_;
    std::deque<UniqueFunction<void()>> work_;
    std::map<DelayedKey, UniqueFunction<void()>> delayed_;
    std::uint64_t lastDelayed_ = 0;
    std::vector<std::thread> threads_;
    std::vector<std::thread::id> finished_;
    std::size_t idle_ = 0;
    std::size_t busy_ = 0;
    std::condition_variable isWorkedOff_;
    bool isEnding_ = false;
};

} // namespace tamblo
