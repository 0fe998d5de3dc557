#include "workers/accessories/ZRReportingSessionAudioRegistrationWorker.h"

#include "base/Dictionary.h"
#include "platform/Counters.h"
#include "platform/PreferenceDomains.h"
#include "util/Log.h"
#include "workers/accessories/AccessoryRegistry.h"

#include <atomic>
#include <chrono>
#include <cstddef>
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
/// Later than what was reported at the last lookup is due again, however long that took.
constexpr std::chrono::milliseconds kNextLookup = AccessoryRegistry::kReportInterval + kLookupInterval;

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

/// The lookups of all sessions, of which there is one at a time. All but `isUnderWay` is for the reporting
/// server queue.
struct ZRReportingSessionAudioRegistrationWorker::Lookups {
    explicit Lookups(Context& owner) : context(owner) {}

    /// Unless there was one just now, or nobody wants to know.
    void lookUpSoon() {
        const Platform& device = context.platform();
        if (!device.analyticsEvents->isEventInUse(kEvent)) {
            return;
        }
        lookUpUnlessRecent(device);
        if (!next) {
            next = device.workQueues->callAfter(
                kNextLookup, [this] { context.serverQueue().post([this] { lookUpAgain(); }); });
        }
    }

    Context& context;
    std::size_t sessions = 0;          ///< that are started
    std::unique_ptr<DelayedCall> next; ///< a day after the last one
    std::optional<WallTime> last;      ///< when it began
    std::atomic<bool> isUnderWay{false};

private:
    void lookUpUnlessRecent(const Platform& device) {
        const WallTime now = device.clock->now();
        // A clock that was set back does not put the next lookup off.
        const bool isRecent = last && *last <= now && now - *last < kLookupInterval;
        if (isRecent || isUnderWay.exchange(true)) {
            counters::add(counters::Counter::accessoryLookups);
            return;
        }
        last = now;
        next.reset();
        // A queue for one piece, which runs after the queue is gone: at most once a minute, none is kept.
        device.workQueues->makeSerialQueue("com.vandra.tamblo.accessories")
            ->post(
                [this] {
                    lookUp(context);
                    isUnderWay = false;
                },
                Pace::mayBlock);
    }

    /// The last session may have stopped since this was posted.
    void lookUpAgain() {
        next.reset();
        if (sessions != 0) {
            lookUpSoon();
        }
    }
};

ZRReportingSessionAudioRegistrationWorker::ZRReportingSessionAudioRegistrationWorker(
    Context& context, std::weak_ptr<ZRReportingSession> session)
    : ZRReportingSessionWorkerConsumerProtocol(context, std::move(session)),
      lookups_(context.shared<Lookups>(context)) {}

ZRReportingSessionAudioRegistrationWorker::~ZRReportingSessionAudioRegistrationWorker() {
    leave();
}

std::optional<bool> ZRReportingSessionAudioRegistrationWorker::start() {
    if (!std::exchange(isCounted_, true)) {
        ++lookups_.sessions;
    }
    lookups_.lookUpSoon();
    return true;
}

bool ZRReportingSessionAudioRegistrationWorker::stopSome() {
    leave();
    return true;
}

void ZRReportingSessionAudioRegistrationWorker::leave() {
    if (std::exchange(isCounted_, false) && --lookups_.sessions == 0) {
        // A service without sessions waits for nothing.
        lookups_.next.reset();
    }
}

} // namespace tamblo
