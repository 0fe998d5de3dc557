#include "workers/accessories/ZRReportingSessionAudioRegistrationWorker.h"

#include "base/Dictionary.h"
#include "platform/Counters.h"
#include "platform/PreferenceDomains.h"
#include "util/Log.h"
#include "workers/accessories/AccessoryRegistry.h"

#include <atomic>
#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace tamblo {

namespace {

using Worker = ZRReportingSessionAudioRegistrationWorker;

constexpr std::string_view kKey = "registered";
/// Accessories come and go in minutes, and their records are files to be read.
constexpr std::chrono::minutes kLookupInterval{1};

/// The lookups of all sessions, of which there is one at a time.
struct Lookups {
    std::optional<WallTime> last; ///< when it began; for the thread that does the sessions' work
    std::atomic<bool> isUnderWay{false};
};

void send(Context& context, std::vector<Dictionary> reports) {
    context.serverQueue().post([&context, reports = std::move(reports)] {
        for (const Dictionary& report : reports) {
            context.platform().analyticsEvents->sendEventLazy(Worker::kEvent, [&report] { return report; });
        }
    });
}

void lookUp(Context& context) {
    const Platform& device = context.platform();
    PreferencesSuite store(*device.preferences, std::string(kAccessoriesDomain));
    const std::optional<Value> kept = store.value(kKey);
    const std::vector<Accessory> seen = device.accessories->connectedEarbuds();
    AccessoryRegistry::Update update = AccessoryRegistry::update(kept, seen, device.clock->now());
    if (update.hadRubbish) {
        log::error(ZRReportingAudioRegistrationCategory(),
                   "{}: {} holds what is no accessory; that is ignored", kAccessoriesDomain, kKey);
    }
    log::debug(ZRReportingAudioRegistrationCategory(), "looked up accessories. seen={} reported={}",
               seen.size(), update.reports.size());
    const bool isChanged = kept ? !(*kept == Value(update.registered)) : !update.registered.empty();
    if (isChanged) {
        // Stored first: after a crash an accessory is rather not reported than twice.
        store.setValue(kKey, update.registered);
    }
    if (!update.reports.empty()) {
        send(context, std::move(update.reports));
    }
}

} // namespace

std::optional<bool> ZRReportingSessionAudioRegistrationWorker::start() {
    const Platform& device = platform();
    if (!device.analyticsEvents->isEventInUse(kEvent)) {
        return true;
    }
    auto& lookups = context().shared<Lookups>();
    const WallTime now = device.clock->now();
    // A clock that was set back does not put the next lookup off.
    const bool isRecent = lookups.last && *lookups.last <= now && now - *lookups.last < kLookupInterval;
    if (isRecent || lookups.isUnderWay.exchange(true)) {
        counters::add(counters::Counter::accessoryLookups);
    } else {
        lookups.last = now;
        // A queue for one piece, which runs after the queue is gone: at most once a minute, none is kept.
        device.workQueues->makeSerialQueue("com.vandra.tamblo.accessories")
            ->post(
                [&context = context(), &lookups] {
                    lookUp(context);
                    lookups.isUnderWay = false;
                },
                Pace::mayBlock);
    }
    return true;
}

} // namespace tamblo
