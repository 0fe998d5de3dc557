#include "workers/sinks/ZRReportingSessionQuilletWorker.h"

#include "base/Mutex.h"
#include "platform/Counters.h"
#include "session/BlockingWork.h"
#include "session/ZRReportingSession.h"
#include "util/Log.h"
#include "workers/ZRReportingSessionWorkerUtility.h"
#include "workers/sinks/CapturePreferences.h"

#include <functional>
#include <map>
#include <optional>
#include <string>
#include <utility>

namespace tamblo {

namespace {

constexpr std::string_view kBackOffKey = "TalvixInvalidXyBackOffSeconds";
constexpr std::string_view kLastRunKey = "TalvixInvalidXyQLTlastRun";
constexpr double kGraceSeconds = 5.0;

constexpr const char* kDisplayReason = "a Talvix spatial positioning error occurred";

// The tracker's own values. A maker whose tracker knows the product's core by another name or number, or the
// audio diagnostics by another identifier, sets them here.
constexpr const char* kComponentName = "Talvix Core";
constexpr const char* kComponentVersion = "All";
constexpr std::int64_t kComponentIdentifier = 520'117;
constexpr std::int32_t kReproducibility = 6;
constexpr std::int32_t kClassification = 7;
constexpr const char* kAudioDiagnosticExtension = "com.vandra.tamblo.diagnostics.audio";

void draftCreated(const std::optional<std::string>& error) {
    if (error) {
        log::error(ZRReportingSessionCategory(), "Error creating draft - {}", *error);
    } else {
        counters::add(counters::Counter::drafts);
        log::info(ZRReportingSessionCategory(), "Successfully created draft");
    }
}

} // namespace

/// The beginnings of back-off periods, by the preference's key, that are being stored. Any thread.
struct ZRReportingSessionQuilletWorker::Beginnings {
    struct Beginning {
        double time = 0.0;
        unsigned count = 0; ///< that are being stored
    };

    [[nodiscard]] std::optional<Value> find(std::string_view key) {
        const MutexLock lock(mutex);
        const auto found = underWay.find(key);
        return found != underWay.end() ? std::optional<Value>(found->second.time) : std::nullopt;
    }
    void begin(std::string_view key, double time) {
        const MutexLock lock(mutex);
        Beginning& beginning = underWay[std::string(key)];
        beginning.time = time;
        ++beginning.count;
    }
    void stored(std::string_view key) {
        const MutexLock lock(mutex);
        const auto found = underWay.find(key);
        if (--found->second.count == 0) {
            underWay.erase(found);
        }
    }

    Mutex mutex;
    std::map<std::string, Beginning, std::less<>> underWay TAMBLO_GUARDED_BY(mutex);
};

std::shared_ptr<ZRReportingSessionWorkerProtocol>
ZRReportingSessionQuilletWorker::initWithSession(Context& context,
                                                 const std::shared_ptr<ZRReportingSession>& session) {
    if (!context.isInternalBuild()) {
        return nullptr;
    }
    const auto backOff = numberPreference(context, kBackOffKey, ZRReportingSessionCategory());
    if (!backOff) {
        log::debug(ZRReportingSessionCategory(), "{} default not set. Skipping worker. reporterID={}",
                   kBackOffKey, session->reporterID());
        return nullptr;
    }
    return std::make_shared<ZRReportingSessionQuilletWorker>(
        context, session, std::chrono::duration<double>(backOff->doubleValue()));
}

ZRReportingSessionQuilletWorker::ZRReportingSessionQuilletWorker(Context& context,
                                                                 std::weak_ptr<ZRReportingSession> session,
                                                                 std::chrono::duration<double> backOffTime)
    : ZRReportingSessionWorkerConsumerProtocol(context, std::move(session)),
      beginnings_(context.shared<Beginnings>()),
      backOffTime_(backOffTime) {}

void ZRReportingSessionQuilletWorker::handleMessage(const MessageRef& message) {
    if (message == nullptr || !interestedInMessage(*message)) {
        return;
    }
    const std::shared_ptr<ZRReportingSession> owner = session();
    const ReporterID reporterID = owner != nullptr ? owner->reporterID() : 0;
    if (hasRun_) {
        counters::add(counters::Counter::draftsBackOff);
        log::debug(ZRReportingSessionCategory(),
                   "Quillet has already run for TalvixXYerrorMessage reporterID={}", reporterID);
        return;
    }
    hasRun_ = true;
    log::standard(ZRReportingSessionCategory(), "Starting quillet for TalvixXYerrorMessage reporterID={}",
                  reporterID);
    // Empty for a process that had exited before its name could be had.
    const std::string processName =
        owner != nullptr ? owner->clientProcessName().value_or(std::string()) : std::string();
    // Behind the storing of the period's beginning; then on the server queue, whose batches are written out
    // before replies go.
    context()
        .shared<BlockingWork>(platform())
        .post([&context = context(), processName,
               reply = owner != nullptr ? owner->holdReply() : nullptr]() mutable {
            context.serverQueue().post([&context, processName, reply = std::move(reply)] {
                context.platform().bugReportDrafting->createDraft(tikletDraftForTalvixXYerror(), processName,
                                                                  kDisplayReason, draftCreated);
            });
        });
}

bool ZRReportingSessionQuilletWorker::stopSome() {
    const std::shared_ptr<ZRReportingSession> owner = session();
    log::debug(ZRReportingSessionCategory(), "Resetting hasRun to false. reporterID={}",
               owner != nullptr ? owner->reporterID() : ReporterID{0});
    hasRun_ = false;
    return true;
}

bool ZRReportingSessionQuilletWorker::interestedInMessage(const ZRReportingSessionMessage& message) {
    const double time = ZRReportingSession::getEpochTimeFromZRReportingStateMessage(message);
    if (minimumMessageTime_ <= 0.0) {
        minimumMessageTime_ = time + kGraceSeconds;
        return false;
    }
    // The preferences are asked last: of nearly all messages, the payload says enough.
    return time > minimumMessageTime_ && ZRReportingSessionWorkerUtility::isTalvixXYerrorMessage(message) &&
           !hasRunInTimeframe(backOffTime_, kLastRunKey);
}

bool ZRReportingSessionQuilletWorker::hasRunInTimeframe(std::chrono::duration<double> backOff,
                                                        std::string_view defaultsKey) {
    const double now = secondsSince1970(platform().clock->now());
    auto lastRun = beginnings_.find(defaultsKey);
    if (!lastRun) {
        lastRun = numberPreference(context(), defaultsKey, ZRReportingSessionCategory());
    }
    if (lastRun && lastRun->doubleValue() > now - backOff.count()) {
        counters::add(counters::Counter::draftsBackOff);
        log::debug(ZRReportingSessionCategory(), "Quillet has run. key={} lastRun={}", defaultsKey, *lastRun);
        return true;
    }
    log::debug(ZRReportingSessionCategory(), "Quillet has not run. key={} backoffSeconds={}", defaultsKey,
               backOff.count());
    beginnings_.begin(defaultsKey, now);
    context()
        .shared<BlockingWork>(platform())
        .post([&context = context(), &beginnings = beginnings_, key = std::string(defaultsKey), now] {
            capturePreferences(context).setValue(key, now);
            beginnings.stored(key);
        });
    return false;
}

BugReportDraft ZRReportingSessionQuilletWorker::tikletDraftForTalvixXYerror() {
    return {.title = "Invalid x/y coordinates during a Talvix call (QLT)",
            .problemDescription =
                "Invalid coordinates were provided to the audio layer during a Talvix call, making it "
                "impossible to render spatial audio correctly. Filing this tiklet will help determine what "
                "went wrong.",
            .component = {.name = kComponentName,
                          .version = kComponentVersion,
                          .identifier = kComponentIdentifier},
            .reproducibility = kReproducibility,
            .classification = kClassification,
            .diagnosticExtensions = {kAudioDiagnosticExtension}};
}

} // namespace tamblo
