#pragma once

#include "base/Mutex.h"
#include "client/Client.h"

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <thread>

namespace tamblo::client {

/// The library's thread: pumps a client's engine until it is destroyed, and closes the engine at the end. It
/// takes no signals, which are the program's own.
class Client::PumpThread {
public:
    PumpThread(Engine& engine, std::chrono::milliseconds linger);
    ~PumpThread();
    PumpThread(const PumpThread&) = delete;
    PumpThread& operator=(const PumpThread&) = delete;

    /// Any thread but its own: waits until all that was queued has been handed to the kernel, at most this
    /// long; whether it has.
    bool flush(std::chrono::milliseconds timeout);

private:
    void run();
    void answerFlushes();

    Engine& engine_;
    const std::chrono::milliseconds linger_;
    std::atomic<bool> isStopping_{false};

    std::atomic<bool> isFlushWanted_{false};

    Mutex mutex_;
    std::condition_variable flushed_;
    std::uint64_t flushesWanted_ TAMBLO_GUARDED_BY(mutex_) = 0;
    std::uint64_t flushesDone_ TAMBLO_GUARDED_BY(mutex_) = 0;

    std::thread thread_;
};

} // namespace tamblo::client
