#include "platform/linux/loop/LimitedQueue.h"

#include "base/Format.h"

#include <utility>

namespace tamblo {

void LimitedQueue::post(Work work) {
    std::uint64_t dropped = 0;
    {
        const MutexLock lock(mutex_);
        if (waiting_ < limit_.waiting) {
            ++waiting_;
            if (queue_ == nullptr) {
                queue_ = workQueues_.makeSerialQueue(label_);
            }
            queue_->post(
                [this, work = std::move(work)]() mutable {
                    begin();
                    work();
                },
                Pace::mayBlock);
            return;
        }
        dropped = ++dropped_;
    }
    if (dropped == 1) {
        log_.report(LogLevel::error, limit_.categoryCode,
                    formatted("{} {} wait; further ones are dropped", limit_.waiting, limit_.what));
    }
}

void LimitedQueue::begin() {
    std::uint64_t dropped = 0;
    {
        const MutexLock lock(mutex_);
        if (--waiting_ == 0) {
            dropped = std::exchange(dropped_, 0);
        }
    }
    if (dropped != 0) {
        log_.report(LogLevel::error, limit_.categoryCode,
                    formatted("no {} wait any more; {} were dropped", limit_.what, dropped));
    }
}

} // namespace tamblo
