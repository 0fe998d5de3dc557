#pragma once

#include "base/Mutex.h"
#include "platform/LogOrigin.h"
#include "platform/WorkQueue.h"
#include "platform/linux/loop/ThreadPool.h"

#include <atomic>
#include <chrono>
#include <cstddef>
#include <memory>
#include <optional>
#include <string_view>
#include <thread>
#include <utility>
#include <vector>

namespace tamblo {

// Why a queue has no thread. Thousands of sessions have a queue each, so a queue is a strand: a list of work
// that is drained by one thread at a time. Whoever posts to a strand that nobody drains sees to it that
// somebody does; from then on it is that thread's until it is found empty, or suspended.
//
// Which thread that is. Waking another thread costs more than a message does, so the event loop's thread
// runs the quick work that it posts itself. It does not run it at once: during a wake-up the strands are
// collected, and drained together at its end or as soon as 256 requests are there, so that one write of the
// sinks and one send of the replies serve all that was read. A strand has that thread for a few milliseconds;
// what it has left then, it goes on with in the next wake-up. Everything else runs on the pool.
//
// Who may block. Nobody on the event loop's thread. A piece that may block goes to the pool, and takes what
// stands behind it along, as the order is kept. Quick work that turns out slow (a disk that stalls) sends its
// strand to the pool for a while.
//
// A batch is what was posted when it begins. At its end the queue's user is called, on the same thread and
// before anything else of the queue runs: that is where the sinks are written and then the replies let go.
// After that, once a thread has done what there was, it calls the end of the run, for what any queue's work
// may have left to be written and no reply waits for.
//
// On whose behalf. What is posted while the thread works for a client is that client's work, wherever it
// runs, and so are the delayed calls that it asks for (`LogOrigin`).
//
// Who owns what. The user owns the queue, and may let it go at any time, in its own work too. The strand is
// shared by the queue and by whoever drains it, so that what was posted still runs.

class Strand;

/// Serial queues as strands, and the threads that these run on: the event loop's during its wake-ups, and a
/// pool's, which makes the delayed calls, too. Works off what was posted before it goes. A queue may be let
/// go after that, but not posted to; a delayed call may not.
class LinuxWorkQueues final : public WorkQueues {
public:
    [[nodiscard]] std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view label) override;
    [[nodiscard]] std::unique_ptr<DelayedCall> callAfter(std::chrono::milliseconds delay,
                                                         UniqueFunction<void()> call) override;
    void workOff() override { pool_.workOff(); }
    /// For when no thread can be had; see `ThreadPool`.
    void setHelper(ThreadPool::CallHelper callHelper) { pool_.setHelper(std::move(callHelper)); }
    void help() { pool_.help(); }

    /// What the calling thread posts from now until `endWakeUp` is collected for it. One thread at a time.
    void beginWakeUp() noexcept { collector_ = std::this_thread::get_id(); }
    /// Runs what was collected; whether some is left for the next wake-up, which then is to come at once.
    bool endWakeUp();
    /// Runs what was collected. On the collecting thread.
    void drain();
    /// Counts what was posted towards a batch; answers how much there is since the last drain.
    std::size_t count(std::size_t posted) noexcept { return posted_ += posted; }
    /// Called at the end of each run of work, on the thread that ran it. Set before the first post.
    void setRunEnd(UniqueFunction<void()> runEnd) { runEnd_ = std::move(runEnd); }

    /// Collects the strand, or has the pool drain it. From any thread.
    void schedule(std::shared_ptr<Strand> strand);
    void scheduleOnPool(std::shared_ptr<Strand> strand);

private:
    void endRun();

    std::atomic<std::thread::id> collector_;
    // The collecting thread's.
    std::vector<std::shared_ptr<Strand>> collected_;
    std::size_t posted_ = 0;

    UniqueFunction<void()> runEnd_;
    ThreadPool pool_; ///< goes first, as it works off what was posted
};

/// What a serial queue is made of; see above.
class Strand final : public std::enable_shared_from_this<Strand> {
public:
    explicit Strand(LinuxWorkQueues& threads) : threads_(threads) {}

    void post(Work work, Pace pace);
    void setBatchEnd(Work batchEnd) { batchEnd_ = std::move(batchEnd); }
    void setMayBlock(bool mayBlock) noexcept { mayBlock_ = mayBlock; }
    void suspend() noexcept { isSuspended_ = true; }
    void resume();

    /// Runs what there is, and what that posts. By whom it was scheduled for.
    void drain();
    /// The same for a few milliseconds, up to a piece that may block or until it takes long: the rest goes to
    /// the pool. Answers whether it is to be called again.
    [[nodiscard]] bool drainQuickly();

private:
    struct Item {
        Work work;
        Pace pace;
        std::optional<ClientIdentity> client; ///< for whom it was posted
    };
    using Time = std::chrono::steady_clock::time_point;

    /// Whether there is something to run: the rest of a batch, or a new one. Otherwise the draining is over.
    bool hasBatch();
    void runBatch(bool stopAtBlocking);

    LinuxWorkQueues& threads_;
    Work batchEnd_;

    // Touched only by whoever drains.
    std::vector<Item> batch_;
    std::size_t next_ = 0;
    Time quickAllowedFrom_{};
    bool mayBlock_ = false;

    std::atomic<bool> isSuspended_{false};
    Mutex mutex_;
    std::vector<Item> pending_ TAMBLO_GUARDED_BY(mutex_);
    bool isScheduled_ TAMBLO_GUARDED_BY(mutex_) = false; ///< somebody drains, or is about to
};

} // namespace tamblo
