#include "util/ReportingServerQueue.h"

#include "platform/Platform.h"

#include <atomic>
#include <memory>
#include <mutex>

namespace tamblo {

namespace {

constinit std::atomic<SerialQueue*> serverQueue{nullptr};
constinit std::mutex creation;

SerialQueue& createServerQueue() {
    const std::lock_guard lock(creation);
    SerialQueue* queue = serverQueue.load(std::memory_order_acquire);
    if (queue == nullptr) {
        queue = platform().workQueues.makeSerialQueue("com.vandra.tamblo.reporting.server").release();
        serverQueue.store(queue, std::memory_order_release);
    }
    return *queue;
}

} // namespace

SerialQueue& ZRReportingUtilityGetReportingServerQueue() {
    SerialQueue* queue = serverQueue.load(std::memory_order_acquire);
    return queue != nullptr ? *queue : createServerQueue();
}

void resetReportingServerQueue() {
    const std::unique_ptr<SerialQueue> dropped(serverQueue.exchange(nullptr, std::memory_order_acq_rel));
}

} // namespace tamblo
