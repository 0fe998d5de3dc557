#pragma once

#include "base/Mutex.h"
#include "platform/Platform.h"

#include <memory>
#include <utility>

namespace tamblo {

/// What sessions and their workers have to do that may wait for a disk, or takes its time: one piece after
/// the other, on a queue apart, so that it holds up neither the server queue nor the loop. One for all
/// sessions, made with `std::make_shared`. Any thread.
class BlockingWork : public std::enable_shared_from_this<BlockingWork> {
public:
    explicit BlockingWork(const Platform& platform);

    void post(Work work) { queue_->post(std::move(work), Pace::mayBlock); }
    /// Much memory was freed: the system is given it back in some seconds, once for all that ask meanwhile.
    void giveBackMemorySoon();

private:
    const Platform& platform_;
    const std::unique_ptr<SerialQueue> queue_;

    Mutex mutex_;
    bool isAsked_ TAMBLO_GUARDED_BY(mutex_) = false;
    std::unique_ptr<DelayedCall> soon_ TAMBLO_GUARDED_BY(mutex_);
};

} // namespace tamblo
