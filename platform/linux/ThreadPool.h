#pragma once

#include "platform/WorkQueue.h"

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <mutex>
#include <thread>
#include <vector>

namespace tamblo {

/// Threads for work that may block. The pool starts empty, grows while every thread is busy, up to a limit,
/// and a thread that finds nothing to do for some seconds ends: an idle process has none. The destructor
/// works off what was posted.
class ThreadPool {
public:
    static constexpr std::size_t kMaximumThreads = 16;

    ThreadPool() = default;
    ~ThreadPool();
    ThreadPool(const ThreadPool&) = delete;
    ThreadPool& operator=(const ThreadPool&) = delete;

    void post(UniqueFunction<void()> work);

private:
    void run();
    void joinFinished();

    std::mutex mutex_; ///< guards what follows
    std::condition_variable hasWork_;
    std::deque<UniqueFunction<void()>> work_;
    std::vector<std::thread> threads_;
    std::vector<std::thread::id> finished_;
    std::size_t idle_ = 0;
    bool isEnding_ = false;
};

} // namespace tamblo
