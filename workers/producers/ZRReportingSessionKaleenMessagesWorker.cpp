#include "workers/producers/ZRReportingSessionKaleenMessagesWorker.h"

#include "session/WorkerClass.h"
#include "session/ZRReportingSession.h"
#include "util/Context.h"
#include "util/Log.h"
#include "util/MessageKeys.h"
#include "workers/producers/PayloadFields.h"
#include "workers/producers/SegmentWalk.h"
#include "workers/producers/SummaryKeys.h"

#include <functional>
#include <memory>
#include <string_view>
#include <utility>

namespace tamblo {

namespace {

/// What "kaleen_session" says of playback that belongs to a group session.
constexpr std::int64_t kInGroupSession = 1;

enum class Field { timestamp, running, duration, group, channels, formatID, devices, format, count };
using Fields = PayloadFields<Field>;

constexpr Fields::Keys kKeys{ZRReportingInternalEventEpochTime,
                             kOutputRunningKey,
                             ZRReportingMessageKeySessionDuration,
                             kGroupSessionKey,
                             kChannelsPerFrameKey,
                             kFormatIDKey,
                             kActiveDevicesKey,
                             kSelectedFormatKey};

constexpr SegmentWords kWords{.function = "createKaleenMessages",
                              .length = "playingTime",
                              .added = "kaleen message",
                              .skipped = "kaleen message, too short or not actually an kaleen session"};

const Dictionary& defaults() {
    static const Dictionary values{{kSelectedFormatKey, kUnknownSetting},
                                   {kActiveDevicesKey, kUnknownSetting},
                                   {kFormatIDKey, kUnknownSetting},
                                   {kChannelsPerFrameKey, -1}};
    return values;
}

/// The only workers that are offered the summaries, but on internal builds, where all are. Every worker still
/// meets them among the session's messages: their values are in the call-quality summary on all builds.
DestinationWorkers destinations(bool isInternalBuild) {
    DestinationWorkers workers;
    if (isInternalBuild) {
        return workers;
    }
    for (const std::string_view name :
         {"ZRReportingSessionEventryWorker", "ZRReportingSessionSummaryJsonFileWorker"}) {
        if (const WorkerClass* workerClass = workerClassNamed(name)) {
            workers.push_back(workerClass);
        }
    }
    return workers;
}

bool isInGroup(const Fields& fields) noexcept {
    return fields.holds(Field::group) && fields[Field::group]->integerValue() == kInGroupSession;
}

/// Whether a setting that both hold differs.
bool watchedFieldChangeInMessage(const Fields& message, const Fields& previous) noexcept {
    const auto differ = [&](Field field, auto read) {
        return message.holds(field) && previous.holds(field) &&
               std::invoke(read, *message[field]) != std::invoke(read, *previous[field]);
    };
    return differ(Field::running, &Value::boolValue) || differ(Field::group, &Value::integerValue) ||
           differ(Field::channels, &Value::integerValue) ||
           settingsDiffer(message[Field::formatID], previous[Field::formatID]) ||
           settingsDiffer(message[Field::devices], previous[Field::devices]);
}

/// One walk over a session's messages.
class KaleenWalk {
public:
    KaleenWalk(Dictionary previousValues, Seconds minimum, DestinationWorkers destinations)
        : previousValues_(std::move(previousValues)),
          minimum_(minimum),
          destinations_(std::move(destinations)),
          state_(previousValues_, places_) {
        isPlaying_ = state_.isTrue(Field::running);
        isInGroup_ = isInGroup(state_);
        if (isPlaying_ && isInGroup_) {
            start_.begin(state_[Field::timestamp]);
        }
    }

    /// Whether a message of these keys can change anything. Any message opens a segment where playback in a
    /// group has none, as the one before told no time.
    [[nodiscard]] bool isConcernedBy(const KeySet& keys) {
        return Fields::anyIn(keys, places_) || (!start_.isKnown() && isPlaying_ && isInGroup_);
    }

    void take(const Dictionary& payload) {
        const Fields message(payload, places_);
        const bool wasInGroupPlayback = state_.isTrue(Field::running) && isInGroup(state_);
        takePlayingState(message);
        const bool isStopped = message.holds(Field::duration);
        if (start_.isKnown() &&
            (isStopped || (wasInGroupPlayback && watchedFieldChangeInMessage(message, state_)))) {
            endSegment(message[Field::timestamp]);
        }
        state_.merge(message);
    }

    [[nodiscard]] std::size_t derivedCount() const noexcept { return derived_.count(); }
    [[nodiscard]] std::vector<MessageRef> finish() { return derived_.take(); }

private:
    void takePlayingState(const Fields& message) {
        if (message.holds(Field::running)) {
            isPlaying_ = message.isTrue(Field::running);
        }
        if (message.holds(Field::group)) {
            isInGroup_ = isInGroup(message);
        }
        if (!start_.isKnown() && isPlaying_ && isInGroup_) {
            start_.begin(message[Field::timestamp]);
        }
        if (message.holds(Field::duration)) {
            isPlaying_ = false;
            isInGroup_ = false;
        }
    }

    void endSegment(const Value* timestamp) {
        const Seconds playingTime = start_.until(timestamp);
        derived_.logLength(start_, timestamp);
        if (playingTime > minimum_ && isInGroup(state_)) {
            derived_.add(summary(playingTime), AudioEventKindKaleen).setDestinationWorkers(destinations_);
        } else {
            derived_.skip();
        }
        start_.begin(isPlaying_ && isInGroup_ ? timestamp : nullptr);
    }

    /// What was in force in the segment, else the default.
    [[nodiscard]] const Value& coalesceKey(Field field, std::string_view key) const {
        return state_.holds(field) ? *state_[field] : *defaults().find(key);
    }

    [[nodiscard]] Dictionary summary(Seconds playingTime) const {
        SummaryKeys<8>::Entries entries{
            {{kSelectedFormatKey, coalesceKey(Field::format, kSelectedFormatKey)},
             {kActiveDevicesKey, coalesceKey(Field::devices, kActiveDevicesKey)},
             {kFormatIDKey, coalesceKey(Field::formatID, kFormatIDKey)},
             {kChannelsPerFrameKey, coalesceKey(Field::channels, kChannelsPerFrameKey)},
             {"play_seconds", singleSeconds(playingTime)},
             {"play_secondsBucketed", timeBucketText(playingTime)},
             {kMessageIndexKey, derived_.nextIndex()},
             {kMessageCountKey, kCountedLater}}};
        static const SummaryKeys keys(entries);
        return keys.payload(entries);
    }

    Dictionary previousValues_;
    Seconds minimum_;
    DestinationWorkers destinations_;
    KeyPlaces places_{kKeys};
    /// The latest value of each key, up to the message before the one at hand.
    Fields state_;
    bool isPlaying_ = false;
    bool isInGroup_ = false;
    SegmentStart start_;
    DerivedMessages derived_{kWords};
};

/// One walk for the session.
Derivation<KaleenWalk> walk(const Context& context, const std::shared_ptr<ZRReportingSession>& session,
                            Seconds minimum) {
    return Derivation(
        KaleenWalk(previousValuesOf(session, kKeys), minimum, destinations(context.isInternalBuild())));
}

} // namespace

bool ZRReportingSessionKaleenMessagesWorker::stopSome() {
    return stopPart(stopLeft_, [this] {
        const std::shared_ptr<ZRReportingSession> owner = session();
        return derivingStop(owner, "kaleen event", walk(context(), owner, leastLengthOf(owner)));
    });
}

std::vector<MessageRef>
ZRReportingSessionKaleenMessagesWorker::createKaleenMessages(const std::vector<MessageRef>& messages,
                                                             Seconds minimumPlaytime) const {
    return derivedBy(walk(context(), session(), minimumPlaytime), messages);
}

} // namespace tamblo
