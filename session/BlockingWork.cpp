#include "session/BlockingWork.h"

#include "base/WhileAlive.h"

#include <chrono>

namespace tamblo {

namespace {

constexpr std::chrono::seconds kUntilMemoryIsGivenBack{2};

} // namespace

BlockingWork::BlockingWork(const Platform& platform)
    : platform_(platform),
      queue_(platform.workQueues->makeSerialQueue("com.vandra.tamblo.reporting.blocking")) {}

void BlockingWork::giveBackMemorySoon() {
    const MutexLock lock(mutex_);
    if (std::exchange(isAsked_, true)) {
        return;
    }
    soon_ = platform_.workQueues->callAfter(
        kUntilMemoryIsGivenBack, whileAlive(weak_from_this(), [](BlockingWork& work) {
            {
                const MutexLock held(work.mutex_);
                work.isAsked_ = false;
            }
            work.post([&platform = work.platform_] { platform.processInformation->giveBackMemory(); });
        }));
}

} // namespace tamblo
