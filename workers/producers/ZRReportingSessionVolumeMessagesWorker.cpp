#include "workers/producers/ZRReportingSessionVolumeMessagesWorker.h"

#include "session/ZRReportingSession.h"
#include "util/Log.h"
#include "util/MessageKeys.h"
#include "workers/producers/PayloadFields.h"
#include "workers/producers/SegmentWalk.h"
#include "workers/producers/SummaryKeys.h"

#include <memory>
#include <optional>
#include <string_view>
#include <utility>

namespace tamblo {

namespace {

/// Spatial-audio settings that are reported within this time are one change.
constexpr Seconds kLongestPauseInBurst{5.0};

enum class Field {
    timestamp,
    running,
    duration,
    format,
    devices,
    spatialized,
    ringer,
    volume,
    spatialFeature,
    formatID,
    channels,
    count
};
using Fields = PayloadFields<Field>;

constexpr Fields::Keys kKeys{ZRReportingInternalEventEpochTime,
                             kOutputRunningKey,
                             ZRReportingMessageKeySessionDuration,
                             kSelectedFormatKey,
                             kActiveDevicesKey,
                             kSpatializationEnabledKey,
                             kRingerStateKey,
                             kVolumeKey,
                             ZRReportingMessageKeySpatialAudioAccessoryFeature,
                             kFormatIDKey,
                             kChannelsPerFrameKey};

constexpr SegmentWords kWords{.function = "createVolumeMessages",
                              .length = "playingTime",
                              .added = "volume message",
                              .skipped = "volume message, too short"};

const Dictionary& defaults() {
    static const Dictionary values{{kSelectedFormatKey, kUnknownSetting},
                                   {kActiveDevicesKey, kUnknownSetting},
                                   {kFormatIDKey, kUnknownSetting},
                                   {ZRReportingMessageKeySpatialAudioAccessoryFeature, false},
                                   {kSpatializationEnabledKey, false},
                                   {kRingerStateKey, false},
                                   {kChannelsPerFrameKey, -1}};
    return values;
}

/// One walk over a session's messages.
class VolumeWalk {
public:
    VolumeWalk(Dictionary previousValues, std::optional<Value> process, Seconds minimum)
        : previousValues_(std::move(previousValues)), process_(std::move(process)), minimum_(minimum) {
        state_ = Fields(defaults(), places_);
        state_.merge(Fields(previousValues_, places_));
        if (state_.isTrue(Field::running)) {
            // What was playing before the first message stays out of the running state: such playback ends
            // no segment until a message says anew that output runs.
            isPlaying_ = true;
            start_.begin(state_[Field::timestamp]);
            state_.set(Field::running, nullptr);
        }
    }

    /// Whether a message of these keys can change anything.
    [[nodiscard]] bool isConcernedBy(const KeySet& keys) { return Fields::anyIn(keys, places_); }

    void take(const Dictionary& payload) {
        const Fields message(payload, places_);
        const bool wasRunning = state_.isTrue(Field::running);
        const bool changed = takePlayingState(message, wasRunning);
        if (wasRunning && (changed || (isPlaying_ && isSettingChanged(message)))) {
            endSegment(message[Field::timestamp]);
        }
        if (!isPlaying_) {
            start_.end();
        }
        state_.merge(message);
    }

    [[nodiscard]] std::size_t derivedCount() const noexcept { return derived_.count(); }
    [[nodiscard]] std::vector<MessageRef> finish() { return derived_.take(); }

private:
    /// Whether output stopped running.
    bool takePlayingState(const Fields& message, bool wasRunning) {
        const bool isStopped = message.holds(Field::duration);
        if (!message.holds(Field::running)) {
            isPlaying_ = isPlaying_ && !isStopped;
            return isStopped;
        }
        isPlaying_ = message.isTrue(Field::running);
        if (!wasRunning && isPlaying_) {
            start_.begin(message[Field::timestamp]);
        }
        return isStopped || (wasRunning && !isPlaying_);
    }

    [[nodiscard]] bool isSettingChanged(const Fields& message) const {
        return settingsDiffer(message[Field::format], state_[Field::format]) ||
               settingsDiffer(message[Field::devices], state_[Field::devices]) ||
               differAsNumbers(message[Field::spatialized], state_[Field::spatialized]) ||
               differAsNumbers(message[Field::ringer], state_[Field::ringer]) ||
               differAsNumbers(message[Field::volume], state_[Field::volume]);
    }

    void endSegment(const Value* timestamp) {
        const Seconds playingTime = start_.until(timestamp);
        derived_.logLength(start_, timestamp);
        if (timestamp != nullptr && start_.isKnown() && playingTime > minimum_ && process_.has_value() &&
            state_.holds(Field::volume)) {
            derived_.add(summary(playingTime), AudioEventKindVolume);
        } else {
            derived_.skip();
        }
        start_.begin(timestamp);
    }

    [[nodiscard]] Dictionary summary(Seconds playingTime) const {
        const Value& volume = *state_[Field::volume];
        SummaryKeys<14>::Entries entries{
            {{kSelectedFormatKey, *state_[Field::format]},
             {kFormatIDKey, *state_[Field::formatID]},
             {kActiveDevicesKey, *state_[Field::devices]},
             {ZRReportingApplicationName, *process_},
             {kVolumeKey, volume},
             {"QVSessionVolumeBucketed", volumeBucketText(volume.doubleValue())},
             {"play_seconds", singleSeconds(playingTime)},
             {ZRReportingMessageKeySpatialAudioAccessoryFeature, *state_[Field::spatialFeature]},
             {kSpatializationEnabledKey, *state_[Field::spatialized]},
             {kRingerStateKey, *state_[Field::ringer]},
             {kChannelsPerFrameKey, *state_[Field::channels]},
             {"play_secondsBucketed", timeBucketText(playingTime)},
             {kMessageIndexKey, derived_.nextIndex()},
             {kMessageCountKey, kCountedLater}}};
        static const SummaryKeys keys(entries);
        return keys.payload(entries);
    }

    Dictionary previousValues_;
    std::optional<Value> process_;
    Seconds minimum_;
    KeyPlaces places_{kKeys};
    /// The latest value of each key, up to the message before the one at hand.
    Fields state_;
    bool isPlaying_ = false;
    SegmentStart start_;
    DerivedMessages derived_{kWords};
};

/// One walk for the session, with bursts folded.
Derivation<VolumeWalk> walk(const std::shared_ptr<ZRReportingSession>& session, std::optional<Value> process,
                            Seconds minimum) {
    return Derivation(VolumeWalk(previousValuesOf(session, kKeys), std::move(process), minimum),
                      rapidSpatialAudioSettings(kLongestPauseInBurst));
}

} // namespace

bool ZRReportingSessionVolumeMessagesWorker::stopSome() {
    return stopPart(stopLeft_, [this] {
        const std::shared_ptr<ZRReportingSession> owner = session();
        return derivingStop(owner, "volume event", walk(owner, applicationOf(owner), leastLengthOf(owner)));
    });
}

std::vector<MessageRef> ZRReportingSessionVolumeMessagesWorker::createVolumeMessages(
    const std::vector<MessageRef>& messages, const Value* process, Seconds minimumPlaytime) const {
    return derivedBy(
        walk(session(), process != nullptr ? std::optional(*process) : std::nullopt, minimumPlaytime),
        messages);
}

} // namespace tamblo
