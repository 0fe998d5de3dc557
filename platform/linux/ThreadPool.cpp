#include "platform/linux/ThreadPool.h"

#include <algorithm>
#include <chrono>
#include <utility>

namespace tamblo {

namespace {

constexpr std::chrono::seconds kIdleLife{5};

} // namespace

ThreadPool::~ThreadPool() {
    std::vector<std::thread> threads;
    {
        const std::lock_guard lock(mutex_);
        isEnding_ = true;
        threads.swap(threads_);
    }
    hasWork_.notify_all();
    for (std::thread& thread : threads) {
        thread.join();
    }
}

void ThreadPool::post(UniqueFunction<void()> work) {
    std::unique_lock lock(mutex_);
    work_.push_back(std::move(work));
    if (idle_ >= work_.size()) {
        hasWork_.notify_one();
        return;
    }
    joinFinished();
    if (threads_.size() < kMaximumThreads) {
        threads_.emplace_back([this] { run(); });
    }
}

void ThreadPool::joinFinished() {
    for (const std::thread::id id : std::exchange(finished_, {})) {
        const auto thread =
            std::find_if(threads_.begin(), threads_.end(),
                         [id](const std::thread& candidate) { return candidate.get_id() == id; });
        // It has left the lock for the last time, so this waits for a return at most.
        thread->join();
        threads_.erase(thread);
    }
}

void ThreadPool::run() {
    std::unique_lock lock(mutex_);
    for (;;) {
        ++idle_;
        const bool isAwake =
            hasWork_.wait_for(lock, kIdleLife, [this] { return !work_.empty() || isEnding_; });
        --idle_;
        if (!isAwake || work_.empty()) {
            break;
        }
        UniqueFunction<void()> work = std::move(work_.front());
        work_.pop_front();
        lock.unlock();
        work();
        work.reset();
        lock.lock();
    }
    finished_.push_back(std::this_thread::get_id());
}

} // namespace tamblo
