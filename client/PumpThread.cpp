#include "client/PumpThread.h"

#include <csignal>
#include <pthread.h>

namespace tamblo::client {

using std::chrono::milliseconds;

namespace {

constexpr milliseconds kIdlePump = std::chrono::hours(1);
/// While somebody waits for the queue to be sent.
constexpr milliseconds kFlushingPump{2};

} // namespace

Client::PumpThread::PumpThread(Engine& engine, milliseconds linger) : engine_(engine), linger_(linger) {
    sigset_t all;
    sigset_t before;
    sigfillset(&all);
    pthread_sigmask(SIG_SETMASK, &all, &before);
    thread_ = std::thread([this] { run(); });
    pthread_sigmask(SIG_SETMASK, &before, nullptr);
    pthread_setname_np(thread_.native_handle(), "tamblo-client");
}

Client::PumpThread::~PumpThread() {
    isStopping_.store(true);
    engine_.wake();
    thread_.join();
}

void Client::PumpThread::run() {
    while (!isStopping_.load()) {
        if (isFlushWanted_.load()) {
            engine_.pump(kFlushingPump);
            answerFlushes();
        } else {
            engine_.pump(kIdlePump);
        }
    }
    const auto deadline = std::chrono::steady_clock::now() + linger_;
    while (!engine_.isFlushed() && engine_.isConnected() && std::chrono::steady_clock::now() < deadline) {
        engine_.pump(kFlushingPump);
    }
    engine_.close();
}

void Client::PumpThread::answerFlushes() {
    const MutexLock lock(mutex_);
    if (engine_.isFlushed() && engine_.isConnected()) {
        flushesDone_ = flushesWanted_;
        isFlushWanted_.store(false);
        flushed_.notify_all();
    }
}

bool Client::PumpThread::flush(milliseconds timeout) {
    const auto deadline = std::chrono::steady_clock::now() + timeout;
    MutexLock lock(mutex_);
    const std::uint64_t mine = ++flushesWanted_;
    isFlushWanted_.store(true);
    engine_.wake();
    while (flushesDone_ < mine &&
           flushed_.wait_until(lock.forWaiting(), deadline) == std::cv_status::no_timeout) {
    }
    if (flushesDone_ < mine && flushesWanted_ == mine) {
        isFlushWanted_.store(false);
    }
    return flushesDone_ >= mine;
}

} // namespace tamblo::client
