#include "platform/linux/loop/LinuxWorkQueues.h"

#include <utility>

namespace tamblo {

namespace {

class PooledCall final : public DelayedCall {
public:
    PooledCall(ThreadPool& pool, std::chrono::milliseconds delay, UniqueFunction<void()> call)
        : pool_(pool), key_(pool.postAfter(delay, std::move(call))) {}
    ~PooledCall() override { pool_.cancel(key_); }
    PooledCall(const PooledCall&) = delete;
    PooledCall& operator=(const PooledCall&) = delete;

private:
    ThreadPool& pool_;
    const ThreadPool::DelayedKey key_;
};

} // namespace

std::unique_ptr<SerialQueue> LinuxWorkQueues::makeSerialQueue(std::string_view label) {
    return std::make_unique<LinuxSerialQueue>(threads_, label);
}

std::unique_ptr<DelayedCall> LinuxWorkQueues::callAfter(std::chrono::milliseconds delay,
                                                        UniqueFunction<void()> call) {
    return std::make_unique<PooledCall>(threads_.pool(), delay, std::move(call));
}

} // namespace tamblo
