#include "platform/linux/loop/LinuxWorkQueues.h"

#include "platform/linux/loop/RetiredThreads.h"

#include <utility>

namespace tamblo {

struct LinuxWorkQueues::TickEnd {
    UniqueFunction<void()> call;
};

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

LinuxWorkQueues::LinuxWorkQueues()
    : tickEnd_(std::make_shared<TickEnd>()), retired_(std::make_shared<LinuxRepeatingTimer::Retired>()) {}

LinuxWorkQueues::~LinuxWorkQueues() = default;

void LinuxWorkQueues::setTickEnd(UniqueFunction<void()> tickEnd) {
    tickEnd_->call = std::move(tickEnd);
}

std::unique_ptr<SerialQueue> LinuxWorkQueues::makeSerialQueue(std::string_view label) {
    return std::make_unique<LinuxSerialQueue>(threads_, label);
}

std::unique_ptr<RepeatingTimer> LinuxWorkQueues::makeRepeatingTimer(std::chrono::milliseconds interval,
                                                                    UniqueFunction<void()> tick) {
    retired_->joinReturned();
    return std::make_unique<LinuxRepeatingTimer>(
        interval,
        [tick = std::move(tick), tickEnd = tickEnd_]() mutable {
            tick();
            if (tickEnd->call) {
                tickEnd->call();
            }
        },
        retired_);
}

std::unique_ptr<DelayedCall> LinuxWorkQueues::callAfter(std::chrono::milliseconds delay,
                                                        UniqueFunction<void()> call) {
    return std::make_unique<PooledCall>(threads_.pool(), delay, std::move(call));
}

} // namespace tamblo
