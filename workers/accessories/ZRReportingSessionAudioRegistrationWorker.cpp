#include "workers/accessories/ZRReportingSessionAudioRegistrationWorker.h"

#include "base/Dictionary.h"
#include "platform/Platform.h"
#include "util/Log.h"
#include "util/ReportingServerQueue.h"
#include "workers/accessories/AccessoryRegistry.h"

#include <chrono>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace tamblo {

namespace {

using Worker = ZRReportingSessionAudioRegistrationWorker;

constexpr std::string_view kDomain = "com.vandra.tamblo.accessories";
constexpr std::string_view kKey = "registered";
/// Accessories come and go in minutes, and their records are files to be read.
constexpr std::chrono::minutes kLookupInterval{1};

constinit std::mutex mutex; ///< guards what follows
constinit std::optional<WallTime> lastLookup;
constinit bool isUnderWay = false;

/// Ends a lookup, also one whose work is dropped.
struct EndTurn {
    void operator()(const void*) const noexcept {
        const std::lock_guard lock(mutex);
        isUnderWay = false;
    }
};
/// A lookup from its begin to its end, of which there is one at a time.
using Turn = std::unique_ptr<const void, EndTurn>;

/// Null when it is not the time for one.
Turn takeTurn(WallTime now) {
    const std::lock_guard lock(mutex);
    // A clock that was set back does not put the next lookup off.
    const bool isRecent = lastLookup && *lastLookup <= now && now - *lastLookup < kLookupInterval;
    if (isRecent || isUnderWay) {
        return nullptr;
    }
    lastLookup = now;
    isUnderWay = true;
    return Turn(&lastLookup);
}

void send(std::vector<Dictionary> reports) {
    ZRReportingUtilityGetReportingServerQueue().post([reports = std::move(reports)] {
        for (const Dictionary& report : reports) {
            platform().analyticsEvents.sendEventLazy(Worker::kEvent, [&report] { return report; });
        }
    });
}

void lookUp() {
    const Platform& device = platform();
    PreferencesSuite store(device.preferences, std::string(kDomain));
    const std::optional<Value> kept = store.value(kKey);
    const std::vector<Accessory> seen = device.accessories.connectedEarbuds();
    AccessoryRegistry::Update update = AccessoryRegistry::update(kept, seen, device.clock.now());
    if (update.hadRubbish) {
        log::error(ZRReportingAudioRegistrationCategory(),
                   "{}: {} holds what is no accessory; that is ignored", kDomain, kKey);
    }
    // Kept first: after a crash an accessory is rather not reported than twice.
    const bool isChanged = kept ? !(*kept == Value(update.registered)) : !update.registered.empty();
    if (isChanged) {
        if (const auto failure = store.setValue(kKey, update.registered)) {
            log::error(ZRReportingAudioRegistrationCategory(), "{}: {} cannot be stored: {}", kDomain, kKey,
                       *failure);
        }
    }
    log::debug(ZRReportingAudioRegistrationCategory(), "looked up accessories. seen={} reported={}",
               seen.size(), update.reports.size());
    if (!update.reports.empty()) {
        send(std::move(update.reports));
    }
}

} // namespace

std::optional<bool> ZRReportingSessionAudioRegistrationWorker::start() {
    const Platform& device = platform();
    if (!device.analyticsEvents.isEventInUse(kEvent)) {
        return true;
    }
    if (Turn turn = takeTurn(device.clock.now())) {
        // A queue for one piece, which runs after the queue is gone: at most once a minute, none is kept.
        device.workQueues.makeSerialQueue("com.vandra.tamblo.accessories")
            ->post([turn = std::move(turn)] { lookUp(); }, Pace::mayBlock);
    }
    return true;
}

void ZRReportingSessionAudioRegistrationWorker::forgetLastLookup() noexcept {
    const std::lock_guard lock(mutex);
    lastLookup.reset();
}

} // namespace tamblo
