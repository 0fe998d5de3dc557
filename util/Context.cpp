#include "util/Context.h"

#include "util/LogCategories.h"

#include <atomic>
#include <cstdlib>

namespace tamblo {

namespace {

constinit std::atomic<Context*> installed{nullptr};

} // namespace

Context::Context(const Platform& platform)
    : platform_(platform),
      serverQueue_(platform.workQueues->makeSerialQueue("com.vandra.tamblo.reporting.server")),
      isInternalBuild_(platform.deviceProperties->booleanProperty("InternalBuild").value_or(false)) {
    if (installed.exchange(this, std::memory_order_acq_rel) != nullptr) {
        std::abort();
    }
    for (const LogCategory& category : log_categories::all) {
        category.turnOn(platform.log->threshold(category.code()));
    }
}

Context::~Context() {
    platform_.workQueues->workOff();
    // What was made last goes first.
    while (!shared_.empty()) {
        shared_.pop_back();
    }
    for (const LogCategory& category : log_categories::all) {
        category.turnOff();
    }
    installed.store(nullptr, std::memory_order_release);
}

Context& Context::current() noexcept {
    return *installed.load(std::memory_order_acquire);
}

} // namespace tamblo
