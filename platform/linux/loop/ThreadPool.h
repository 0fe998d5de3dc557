#pragma once

#include "base/Mutex.h"
#include "base/UniqueFunction.h"

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <thread>
#include <utility>
#include <vector>

namespace tamblo {

/// Threads for work that may block, and for calls at a later time. The pool starts empty, grows while every
/// thread is busy, up to a limit, and a thread that finds nothing to do for some seconds ends, but for
/// one while a call is to come: an idle process has none. The destructor works off what was posted; calls
/// whose time has not come are dropped.
///
/// Where the system refuses the first thread, somebody else's has to do: the helper, a thread that was told
/// of beforehand, is asked to call `help`. Slow is better than not at all.
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

    /// Asks the helper's thread to call `help` after a delay. Called with the pool's lock held.
    using CallHelper = UniqueFunction<void(std::chrono::milliseconds delay)>;
    /// Before the first work.
    void setHelper(CallHelper callHelper) { callHelper_ = std::move(callHelper); }
    /// Does a piece of work, unless there are threads for it.
    void help() TAMBLO_EXCLUDES(mutex_);

    void post(UniqueFunction<void()> work) TAMBLO_EXCLUDES(mutex_);
    [[nodiscard]] DelayedKey postAfter(std::chrono::milliseconds delay, UniqueFunction<void()> work)
        TAMBLO_EXCLUDES(mutex_);
    /// Nothing when the call has begun.
    void cancel(const DelayedKey& key) TAMBLO_EXCLUDES(mutex_);
    /// Returns when there is no work left; delayed calls that have not begun are dropped. Not from work.
    void workOff() TAMBLO_EXCLUDES(mutex_);

private:
    void run() TAMBLO_EXCLUDES(mutex_);
    /// Sees to it that somebody will take the work.
    void callThread() TAMBLO_REQUIRES(mutex_);
    void takeDueCalls() TAMBLO_REQUIRES(mutex_);
    [[nodiscard]] bool waitForWork(MutexLock& lock) TAMBLO_REQUIRES(mutex_);
    void joinFinished() TAMBLO_REQUIRES(mutex_);
    void startThread() TAMBLO_REQUIRES(mutex_);
    void callHelper() TAMBLO_REQUIRES(mutex_);
    /// Lets the mutex go while the work runs.
    void doFirst() TAMBLO_REQUIRES(mutex_);

    CallHelper callHelper_;
    Mutex mutex_;
    std::condition_variable hasWork_;
    std::deque<UniqueFunction<void()>> work_ TAMBLO_GUARDED_BY(mutex_);
    std::map<DelayedKey, UniqueFunction<void()>> delayed_ TAMBLO_GUARDED_BY(mutex_);
    std::uint64_t lastDelayed_ TAMBLO_GUARDED_BY(mutex_) = 0;
    std::vector<std::thread> threads_ TAMBLO_GUARDED_BY(mutex_);
    std::vector<std::thread::id> finished_ TAMBLO_GUARDED_BY(mutex_);
    std::size_t idle_ TAMBLO_GUARDED_BY(mutex_) = 0;
    std::size_t busy_ TAMBLO_GUARDED_BY(mutex_) = 0;
    std::condition_variable isWorkedOff_;
    bool isEnding_ TAMBLO_GUARDED_BY(mutex_) = false;
};

} // namespace tamblo
