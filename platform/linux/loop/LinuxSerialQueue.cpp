#include "platform/linux/loop/LinuxSerialQueue.h"

#include <utility>

namespace tamblo {

namespace {

thread_local InlineDrain* currentDrain = nullptr;

/// A batch that takes longer than this ran into something slow (a disk that stalls, most likely). For this
/// many times as long the queue is then left to the pool, so that the responsive thread is held up for a
/// small share of the time, and so that a short hold-up, when other programs had the processor, has no
/// lasting effect.
constexpr std::chrono::milliseconds kSlowBatch{25};
constexpr int kInlineBanFactor = 4;

} // namespace

InlineDrain::InlineDrain() {
    currentDrain = this;
}

InlineDrain::~InlineDrain() {
    drain();
    currentDrain = nullptr;
}

InlineDrain* InlineDrain::current() noexcept {
    return currentDrain;
}

void InlineDrain::drain() {
    // Draining one queue may post to others, which then join the list.
    for (std::size_t i = 0; i < strands_.size(); ++i) {
        const std::shared_ptr<Strand> strand = std::move(strands_[i]);
        strand->drainInline();
    }
    strands_.clear();
    posted_ = 0;
}

void Strand::post(Work work, Pace pace) {
    {
        const std::lock_guard lock(mutex_);
        pending_.push_back({std::move(work), pace});
        if (std::exchange(isScheduled_, true)) {
            return;
        }
    }
    schedule();
}

void Strand::resume() {
    {
        const std::lock_guard lock(mutex_);
        // The rest of a batch is nobody's while none drains.
        if (!isSuspended_.exchange(false) || isScheduled_ || (next_ == batch_.size() && pending_.empty())) {
            return;
        }
        isScheduled_ = true;
    }
    schedule();
}

void Strand::schedule() {
    if (currentDrain != nullptr) {
        currentDrain->strands_.push_back(shared_from_this());
    } else {
        handToPool();
    }
}

void Strand::handToPool() {
    pool_.post([strand = shared_from_this()] { strand->drainOnPool(); });
}

bool Strand::hasBatch() {
    const bool hasRest = next_ != batch_.size();
    if (!hasRest) {
        batch_.clear();
        next_ = 0;
    }
    const std::lock_guard lock(mutex_);
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
        item.work();
        // What the work holds is let go before the next runs, as if it had never been queued.
        item.work.reset();
        ++next_;
    }
    if (batchEnd_) {
        batchEnd_();
    }
}

void Strand::drainOnPool() {
    while (hasBatch()) {
        runBatch(false);
    }
}

void Strand::drainInline() {
    Time started = std::chrono::steady_clock::now();
    if (started < inlineAllowedFrom_) {
        handToPool();
        return;
    }
    while (hasBatch()) {
        runBatch(true);
        const Time ended = std::chrono::steady_clock::now();
        if (ended - started > kSlowBatch) {
            inlineAllowedFrom_ = ended + kInlineBanFactor * (ended - started);
        }
        if (isSuspended_) {
            continue;
        }
        if (next_ != batch_.size() || ended < inlineAllowedFrom_) {
            handToPool();
            return;
        }
        started = ended;
    }
}

} // namespace tamblo
