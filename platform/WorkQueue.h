#pragma once

#include "base/UniqueFunction.h"
#include "platform/RequestTally.h"

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <memory>
#include <string_view>
#include <vector>

namespace tamblo {

/// What a request's work captures fits into this many bytes, so that queueing it allocates nothing.
inline constexpr std::size_t kWorkInlineBytes = 144;
/// One piece of queued work.
using Work = UniqueFunction<void(), kWorkInlineBytes>;

/// What a piece of work may do to the thread that runs it.
enum class Pace {
    quick,    ///< neither waits nor computes for long; may run on a thread that must stay responsive
    mayBlock, ///< may wait for a disk, a lock or another process, or takes milliseconds
};

/// Runs work one piece at a time, in the order posted, on whatever thread suits. What was posted still runs
/// after the queue is destroyed, which waits for nothing and may happen in the queue's own work.
class SerialQueue {
public:
    virtual ~SerialQueue() = default;
    /// From any thread, without blocking. The work runs later, never inside this call.
    virtual void post(Work work, Pace pace = Pace::quick) = 0;
    /// Called after each run of pieces, on the thread that ran them, before others run. Set before the first
    /// post.
    virtual void setBatchEnd(Work batchEnd) = 0;
    /// Whether from now on every piece may block, whatever it was posted as. From the queue's own work only,
    /// so that no piece slips through in between.
    virtual void setMayBlock(bool mayBlock) = 0;
    /// No further piece begins until `resume`, on whatever thread that is called; what is posted meanwhile
    /// waits. From any thread; from the queue's own work, not even what was posted before begins. Not nested:
    /// to suspend twice is to suspend once, and to resume a queue that runs is nothing. Destroying the queue
    /// resumes it, so that nothing is stranded.
    virtual void suspend() = 0;
    virtual void resume() = 0;
};

/// One client's requests: work that runs on the reporting server queue, one piece at a time in the order
/// posted, in turns with that of the other clients. It holds what it was given until that has run; letting
/// go of the queue itself drops nothing.
class RequestQueue {
public:
    virtual ~RequestQueue() = default;
    /// From any thread, without blocking. The work runs later, never inside this call.
    virtual void post(Work work, Pace pace = Pace::quick) = 0;
    /// The rest of a request that takes long, or has waited: runs before whatever was posted, once other
    /// clients have had their turns, and even while the queue is suspended, since what has begun ends. On the
    /// reporting server queue; one for each piece of work.
    virtual void postNext(Work work, Pace pace = Pace::quick) = 0;
    /// No further piece begins until each `suspend` has had its `resume`. From any thread.
    virtual void suspend() = 0;
    virtual void resume() = 0;
    /// Drops what waits, the rest of a request too, without running it. Runs what is posted later, whoever
    /// has suspended it, or will. On the reporting server queue, outside the queue's own work.
    virtual void abandon() = 0;

    /// What the client has asked for.
    [[nodiscard]] RequestTally& tally() noexcept { return tally_; }

    /// Processor time, as somebody adds it up on the reporting server queue.
    using TimeAccount = std::shared_ptr<std::chrono::nanoseconds>;
    /// Says for whom the piece of work that runs does something besides the client; several share what it
    /// takes. On the reporting server queue, in the piece.
    void chargeTo(const TimeAccount& account) {
        if (charged_ == accounts_.size() || accounts_[charged_] != account) {
            placeAccount(account);
        }
        ++charged_;
    }

protected:
    /// At the end of the piece.
    void charge(std::chrono::nanoseconds time) noexcept {
        tally_.addTime(time);
        const auto share = charged_ > 1 ? time / static_cast<std::int64_t>(charged_) : time;
        for (std::size_t i = 0; i != charged_; ++i) {
            *accounts_[i] += share;
        }
        charged_ = 0;
    }

private:
    void placeAccount(const TimeAccount& account) {
        accounts_.resize(std::max(accounts_.size(), charged_ + 1));
        accounts_[charged_] = account;
    }

    RequestTally tally_;
    /// The first ones are those of this piece, the others of pieces before: most clients have one session.
    std::vector<TimeAccount> accounts_;
    std::size_t charged_ = 0;
};

/// One call that is to come. Destroying it calls it off; a call that has begun is not waited for.
class DelayedCall {
public:
    virtual ~DelayedCall() = default;
};

/// Makes queues and delayed calls, which their users own and let go before the process ends. Any thread.
class WorkQueues {
public:
    virtual ~WorkQueues() = default;
    /// The label says what the queue is for, to whoever lists the queues.
    [[nodiscard]] virtual std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view label) = 0;
    /// Makes the call once, after the delay, on some thread; it must not block.
    [[nodiscard]] virtual std::unique_ptr<DelayedCall> callAfter(std::chrono::milliseconds delay,
                                                                 UniqueFunction<void()> call) = 0;
    /// Returns once everything that was posted has run, and what that has posted; calls whose time has not
    /// come are called off. Not from a piece of work.
    virtual void workOff() = 0;
};

} // namespace tamblo
