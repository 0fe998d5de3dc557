#include "platform/linux/loop/LinuxWorkQueues.h"

#include <string_view>
#include <utility>

namespace tamblo {

namespace {

/// A batch that takes longer than this ran into something slow (a disk that stalls, most likely). For this
/// many times as long the queue is then left to the pool, so that the responsive thread is held up for a
/// small share of the time, and so that a short hold-up, when other programs had the processor, has no
/// lasting effect.
constexpr std::chrono::milliseconds kSlowBatch{25};
constexpr int kSlowBatchFactor = 4;
/// A strand has the responsive thread for so long in a wake-up.
constexpr std::chrono::milliseconds kLentTime{4};

/// A serial queue: its user's hold on a strand, which lives on until it has run what was posted.
class LinuxSerialQueue final : public SerialQueue {
public:
    /// The threads must outlive the queue's work.
    explicit LinuxSerialQueue(LinuxWorkQueues& threads) : strand_(std::make_shared<Strand>(threads)) {}
    ~LinuxSerialQueue() override { strand_->resume(); }
    LinuxSerialQueue(const LinuxSerialQueue&) = delete;
    LinuxSerialQueue& operator=(const LinuxSerialQueue&) = delete;

    void post(Work work, Pace pace) override { strand_->post(std::move(work), pace); }
    void setBatchEnd(Work batchEnd) override { strand_->setBatchEnd(std::move(batchEnd)); }
    void setMayBlock(bool mayBlock) override { strand_->setMayBlock(mayBlock); }
    void suspend() override { strand_->suspend(); }
    void resume() override { strand_->resume(); }

private:
    const std::shared_ptr<Strand> strand_;
};

class PooledCall final : public DelayedCall {
public:
    PooledCall(ThreadPool& pool, std::chrono::milliseconds delay, UniqueFunction<void()> call)
        : pool_(pool),
          key_(pool.postAfter(delay, [client = LogOrigin::client(), call = std::move(call)]() mutable {
              const LogOrigin origin(client);
              call();
          })) {}
    ~PooledCall() override { pool_.cancel(key_); }
    PooledCall(const PooledCall&) = delete;
    PooledCall& operator=(const PooledCall&) = delete;

private:
    ThreadPool& pool_;
    const ThreadPool::DelayedKey key_;
};

} // namespace

std::unique_ptr<SerialQueue> LinuxWorkQueues::makeSerialQueue(std::string_view) {
    return std::make_unique<LinuxSerialQueue>(*this);
}

std::unique_ptr<DelayedCall> LinuxWorkQueues::callAfter(std::chrono::milliseconds delay,
                                                        UniqueFunction<void()> call) {
    return std::make_unique<PooledCall>(pool_, delay, std::move(call));
}

bool LinuxWorkQueues::endWakeUp() {
    drain();
    collector_ = std::thread::id();
    return !collected_.empty();
}

void LinuxWorkQueues::drain() {
    posted_ = 0;
    if (collected_.empty()) {
        return;
    }
    // Draining one strand may post to others, which then join the list.
    std::vector<std::shared_ptr<Strand>> left;
    for (std::size_t i = 0; i < collected_.size(); ++i) {
        std::shared_ptr<Strand> strand = std::move(collected_[i]);
        if (strand->drainQuickly()) {
            left.push_back(std::move(strand));
        }
    }
    collected_.swap(left);
    endRun();
}

void LinuxWorkQueues::schedule(std::shared_ptr<Strand> strand) {
    if (collector_.load(std::memory_order_relaxed) == std::this_thread::get_id()) {
        collected_.push_back(std::move(strand));
    } else {
        scheduleOnPool(std::move(strand));
    }
}

void LinuxWorkQueues::scheduleOnPool(std::shared_ptr<Strand> strand) {
    pool_.post([this, strand = std::move(strand)] {
        strand->drain();
        endRun();
    });
}

void LinuxWorkQueues::endRun() {
    if (runEnd_) {
        runEnd_();
    }
}

void Strand::post(Work work, Pace pace) {
    {
        const MutexLock lock(mutex_);
        pending_.push_back({std::move(work), pace, LogOrigin::client()});
        if (std::exchange(isScheduled_, true)) {
            return;
        }
    }
    threads_.schedule(shared_from_this());
}

void Strand::resume() {
    {
        const MutexLock lock(mutex_);
        // The rest of a batch may be looked at here while nobody drains.
        if (!isSuspended_.exchange(false) || isScheduled_ || (next_ == batch_.size() && pending_.empty())) {
            return;
        }
        isScheduled_ = true;
    }
    threads_.schedule(shared_from_this());
}

bool Strand::hasBatch() {
    const bool hasRest = next_ != batch_.size();
    if (!hasRest) {
        batch_.clear();
        next_ = 0;
    }
    const MutexLock lock(mutex_);
    if (isSuspended_ || (!hasRest && pending_.empty())) {
        isScheduled_ = false;
        return false;
    }
    if (!hasRest) {
        batch_.swap(pending_);
    }
    return true;
}

void Strand::runBatch(bool stopAtBlocking) {
    while (next_ != batch_.size() && !isSuspended_) {
        Item& item = batch_[next_];
        if (stopAtBlocking && (mayBlock_ || item.pace == Pace::mayBlock)) {
            break;
        }
        const LogOrigin origin(item.client);
        item.work();
        // What the work holds is let go before the next runs, as if it had never been queued.
        item.work.reset();
        ++next_;
    }
    if (batchEnd_) {
        batchEnd_();
    }
}

void Strand::drain() {
    while (hasBatch()) {
        runBatch(false);
    }
}

bool Strand::drainQuickly() {
    Time started = std::chrono::steady_clock::now();
    const Time lentUntil = started + kLentTime;
    bool isForPool = started < quickAllowedFrom_;
    while (!isForPool && hasBatch()) {
        runBatch(true);
        const Time ended = std::chrono::steady_clock::now();
        if (ended - started > kSlowBatch) {
            quickAllowedFrom_ = ended + kSlowBatchFactor * (ended - started);
        }
        const bool isAtBlocking = next_ != batch_.size() && !isSuspended_;
        isForPool = isAtBlocking || ended < quickAllowedFrom_;
        if (!isForPool && ended >= lentUntil) {
            return true;
        }
        started = ended;
    }
    if (isForPool) {
        threads_.scheduleOnPool(shared_from_this());
    }
    return false;
}

} // namespace tamblo
