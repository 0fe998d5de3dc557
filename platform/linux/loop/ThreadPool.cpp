#include "platform/linux/loop/ThreadPool.h"

#include <algorithm>
#include <chrono>
#include <system_error>
#include <utility>

namespace tamblo {

namespace {

constexpr std::chrono::seconds kIdleLife{5};

} // namespace

ThreadPool::~ThreadPool() {
    std::vector<std::thread> threads;
    {
        const MutexLock lock(mutex_);
        isEnding_ = true;
        threads.swap(threads_);
    }
    hasWork_.notify_all();
    for (std::thread& thread : threads) {
        thread.join();
    }
}

void ThreadPool::post(UniqueFunction<void()> work) {
    const MutexLock lock(mutex_);
    work_.push_back(std::move(work));
    callThread();
}

ThreadPool::DelayedKey ThreadPool::postAfter(std::chrono::milliseconds delay, UniqueFunction<void()> work) {
    const MutexLock lock(mutex_);
    const DelayedKey key{std::chrono::steady_clock::now() + delay, ++lastDelayed_};
    delayed_.emplace(key, std::move(work));
    if (delayed_.begin()->first != key) {
        return key;
    }
    if (idle_ != 0) {
        // Those that wait for the call that was next have to wake up for this one instead.
        hasWork_.notify_all();
    } else {
        callThread();
    }
    return key;
}

void ThreadPool::cancel(const DelayedKey& key) {
    UniqueFunction<void()> dropped;
    const MutexLock lock(mutex_);
    const auto found = delayed_.find(key);
    if (found != delayed_.end()) {
        dropped = std::move(found->second);
        delayed_.erase(found);
    }
}

void ThreadPool::workOff() {
    MutexLock lock(mutex_);
    while (!delayed_.empty() || !work_.empty() || busy_ != 0) {
        auto dropped = std::exchange(delayed_, {});
        lock.unlock();
        dropped.clear();
        lock.lock();
        while (!work_.empty() || busy_ != 0) {
            if (threads_.empty()) {
                doFirst();
            } else {
                isWorkedOff_.wait(lock.forWaiting());
            }
        }
    }
}

void ThreadPool::help() {
    MutexLock lock(mutex_);
    takeDueCalls();
    if (!threads_.empty()) {
        return;
    }
    if (!work_.empty()) {
        doFirst();
    }
    if (!work_.empty() || !delayed_.empty()) {
        callThread();
    }
}

void ThreadPool::callHelper() {
    if (!callHelper_) {
        return;
    }
    std::chrono::milliseconds delay{0};
    if (work_.empty() && !delayed_.empty()) {
        const auto left = delayed_.begin()->first.first - std::chrono::steady_clock::now();
        delay = std::max(delay, std::chrono::ceil<std::chrono::milliseconds>(left));
    }
    callHelper_(delay);
}

void ThreadPool::startThread() {
    try {
        threads_.emplace_back([this] { run(); });
    } catch (const std::system_error&) {
        // Those there are will come to it.
        if (threads_.empty()) {
            callHelper();
        }
    }
}

void ThreadPool::callThread() {
    if (isEnding_) {
        // Whoever posts at the end is one of the pool's threads, and takes it next.
        return;
    }
    if (idle_ >= std::max<std::size_t>(work_.size(), 1)) {
        hasWork_.notify_one();
        return;
    }
    joinFinished();
    if (threads_.size() < kMaximumThreads) {
        startThread();
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

void ThreadPool::takeDueCalls() {
    const Time now = std::chrono::steady_clock::now();
    while (!delayed_.empty() && delayed_.begin()->first.first <= now) {
        work_.push_back(std::move(delayed_.begin()->second));
        delayed_.erase(delayed_.begin());
        if (work_.size() > 1) {
            // The caller takes one itself.
            callThread();
        }
    }
}

bool ThreadPool::waitForWork(MutexLock& lock) {
    const Time idleSince = std::chrono::steady_clock::now();
    for (;;) {
        takeDueCalls();
        if (!work_.empty()) {
            return true;
        }
        const Time now = std::chrono::steady_clock::now();
        // One thread stays for as long as a call is to come.
        const bool isNeeded = !delayed_.empty() && idle_ == 0;
        if (isEnding_ || (now >= idleSince + kIdleLife && !isNeeded)) {
            return false;
        }
        Time until = isNeeded ? Time::max() : idleSince + kIdleLife;
        if (!delayed_.empty()) {
            until = std::min(until, delayed_.begin()->first.first);
        }
        ++idle_;
        hasWork_.wait_until(lock.forWaiting(), until);
        --idle_;
    }
}

void ThreadPool::run() {
    MutexLock lock(mutex_);
    while (waitForWork(lock)) {
        if (idle_ == 0 && !delayed_.empty()) {
            // While this work blocks, another thread has to wait for the calls to come.
            callThread();
        }
        doFirst();
    }
    finished_.push_back(std::this_thread::get_id());
}

void ThreadPool::doFirst() {
    UniqueFunction<void()> work = std::move(work_.front());
    work_.pop_front();
    ++busy_;
    mutex_.unlock();
    work();
    work.reset();
    mutex_.lock();
    if (--busy_ == 0 && work_.empty()) {
        isWorkedOff_.notify_all();
    }
}

} // namespace tamblo
