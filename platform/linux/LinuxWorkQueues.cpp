#include "platform/linux/LinuxWorkQueues.h"

#include "platform/linux/LinuxSerialQueue.h"
#include "platform/linux/RetiredThreads.h"

#include <utility>

namespace tamblo {

struct LinuxWorkQueues::TickEnd {
    UniqueFunction<void()> call;
};

LinuxWorkQueues::LinuxWorkQueues()
    : tickEnd_(std::make_shared<TickEnd>()), retired_(std::make_shared<LinuxRepeatingTimer::Retired>()) {}

LinuxWorkQueues::~LinuxWorkQueues() = default;

void LinuxWorkQueues::setTickEnd(UniqueFunction<void()> tickEnd) {
    tickEnd_->call = std::move(tickEnd);
}

std::unique_ptr<SerialQueue> LinuxWorkQueues::makeSerialQueue(std::string_view label) {
    return std::make_unique<LinuxSerialQueue>(pool_, label);
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

} // namespace tamblo
