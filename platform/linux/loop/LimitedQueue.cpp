#include "platform/linux/loop/LimitedQueue.h"

#include "base/Format.h"

#include <utility>

namespace tamblo {

void LimitedQueue::post(Work work) {
    const std::optional<ClientIdentity> client = LogOrigin::client();
    const User user = client ? User(client->user) : std::nullopt;
    bool isUserFull = false;
    {
        const MutexLock lock(mutex_);
        const auto ofUser = waitingOf_.find(user);
        const bool isFull = waiting_ == limit_.waiting;
        isUserFull = !isFull && ofUser != waitingOf_.end() && ofUser->second == limit_.ofUser;
        if (!isFull && !isUserFull) {
            ++waiting_;
            ++waitingOf_[user];
            if (queue_ == nullptr) {
                queue_ = workQueues_.makeSerialQueue(label_);
            }
            queue_->post(
                [this, user, work = std::move(work)]() mutable {
                    begin(user);
                    work();
                },
                Pace::mayBlock);
            return;
        }
        counters::add(limit_.counted);
        if (++dropped_ > 1) {
            return;
        }
    }
    const std::string whose = !isUserFull ? ""
                              : user      ? formatted(" of user {}", *user)
                                          : " of the service itself";
    log_.report(LogLevel::error, limit_.categoryCode,
                formatted("{} {}{} wait; further ones are dropped",
                          isUserFull ? limit_.ofUser : limit_.waiting, limit_.what, whose));
}

void LimitedQueue::begin(User user) {
    std::uint64_t dropped = 0;
    {
        const MutexLock lock(mutex_);
        if (--waitingOf_[user] == 0) {
            waitingOf_.erase(user);
        }
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
