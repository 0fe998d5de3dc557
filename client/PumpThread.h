#pragma once

#include "client/Client.h"

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <mutex>
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

    bool flush(std::chrono::milliseconds timeout);

private:
    void run();
    void answerFlushes();

    Engine& engine_;
    const std::chrono::milliseconds linger_;
    std::atomic<bool> isStopping_{false};

    std::mutex mutex_;
    std::condition_variable flushed_;
    std::uint64_t flushesWanted_ = 0;
    std::uint64_t flushesDone_ = 0;
    std::atomic<bool> isFlushWanted_{false};

    std::thread thread_;
};

} // namespace tamblo::client
