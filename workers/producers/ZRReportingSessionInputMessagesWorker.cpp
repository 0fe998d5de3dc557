#include "workers/producers/ZRReportingSessionInputMessagesWorker.h"

#include "base/Format.h"
#include "session/ZRReportingSession.h"
#include "util/Log.h"
#include "util/MessageKeys.h"
#include "util/ReportingUtilities.h"
#include "workers/producers/PayloadFields.h"
#include "workers/producers/SegmentWalk.h"
#include "workers/producers/SummaryKeys.h"

#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <utility>

namespace tamblo {

namespace {

/// Spatial-audio settings that are reported within this time are one message.
constexpr Seconds kLongestPauseInBurst{2.0};

enum class Field {
    timestamp,
    running,
    duration,
    devices,
    vocoder,
    vocoderRate,
    operationMode,
    inputPort,
    count
};
using Fields = PayloadFields<Field>;

constexpr Fields::Keys kKeys{ZRReportingInternalEventEpochTime,
                             kInputRunningKey,
                             ZRReportingMessageKeySessionDuration,
                             kActiveDevicesKey,
                             kVocoderKey,
                             kVocoderRateKey,
                             kOperationModeKey,
                             kInputPortKey};

constexpr SegmentWords kWords{.function = "createInputMessages",
                              .length = "runningTime",
                              .added = "input message",
                              .skipped = "input message, too short"};

const Dictionary& defaults() {
    static const Dictionary values{{kActiveDevicesKey, kUnknownSetting},
                                   {kOperationModeKey, kUnknownSetting},
                                   {kInputPortKey, kUnknownSetting},
                                   {kVocoderRateKey, kUnknownSetting},
                                   {kVocoderKey, kUnknownSetting}};
    return values;
}

std::string joined(const std::set<std::string>& entries) {
    std::string text;
    for (const std::string& entry : entries) {
        text += text.empty() ? entry : "," + entry;
    }
    return text;
}

/// One walk over a session's messages. It always begins with input not running: what earlier runs of the
/// session left opens no segment.
class InputWalk {
public:
    InputWalk(Dictionary previousValues, std::optional<Value> process, Seconds minimum)
        : previousValues_(std::move(previousValues)), process_(std::move(process)), minimum_(minimum) {
        state_ = Fields(defaults(), places_);
        state_.merge(Fields(previousValues_, places_));
    }

    /// Whether a message of these keys can change anything.
    [[nodiscard]] bool isConcernedBy(const KeySet& keys) { return Fields::anyIn(keys, places_); }

    void take(const Dictionary& payload) {
        const Fields message(payload, places_);
        const bool wasRunning = state_.isTrue(Field::running);
        bool changed = message.holds(Field::duration);
        if (runsOn(message, wasRunning)) {
            isRunning_ = true;
            changed = isPresentAndHasChanged(message[Field::devices], state_[Field::devices]) || changed;
            noteVocoder(message);
        } else {
            isRunning_ = false;
            changed = changed || message.holds(Field::running);
        }
        if (wasRunning && changed) {
            endSegment(message[Field::timestamp]);
        }
        if (!isRunning_) {
            start_.end();
        }
        state_.merge(message);
    }

    [[nodiscard]] std::size_t derivedCount() const noexcept { return derived_.count(); }
    [[nodiscard]] std::vector<MessageRef> finish() {
        log::debug(ZRReportingSessionCategory(),
                   "returning input messages { func={}, action=return, count={} }", kWords.function,
                   derived_.count());
        return derived_.take();
    }

private:
    /// Whether input runs on, or begins to, with this message.
    bool runsOn(const Fields& message, bool wasRunning) {
        if (!message.holds(Field::running)) {
            return isRunning_ && !message.holds(Field::duration);
        }
        const bool isRunning = message.isTrue(Field::running);
        if (isRunning && !wasRunning) {
            start_.begin(message[Field::timestamp]);
        }
        return isRunning;
    }

    void noteVocoder(const Fields& message) {
        if (!isPresentAndHasChanged(message[Field::vocoder], state_[Field::vocoder])) {
            return;
        }
        const std::string rate = formatted("{}", message[Field::vocoderRate]);
        // A rate that begins so stands for a vocoder that does not run.
        if (!rate.starts_with("0.")) {
            vocoders_.insert(formatted("{}:{}", *message[Field::vocoder], rate));
        }
    }

    void endSegment(const Value* timestamp) {
        const Seconds runningTime = start_.until(timestamp);
        derived_.logLength(start_, timestamp);
        if (timestamp != nullptr && start_.isKnown() && process_.has_value() && runningTime > minimum_) {
            derived_.add(summary(runningTime), AudioEventKindInput);
            vocoders_.clear();
        } else {
            // The vocoders stay for the next segment.
            derived_.skip();
        }
        start_.begin(timestamp);
    }

    [[nodiscard]] Dictionary summary(Seconds runningTime) const {
        SummaryKeys<8>::Entries entries{{{ZRReportingApplicationName, *process_},
                                         {"inputrunning_seconds", singleSeconds(runningTime)},
                                         {"inputrunning_secondsBucketed", timeBucketText(runningTime)},
                                         {kMessageIndexKey, derived_.nextIndex()},
                                         {kOperationModeKey, *state_[Field::operationMode]},
                                         {kInputPortKey, *state_[Field::inputPort]},
                                         {kActiveDevicesKey, *state_[Field::devices]},
                                         {kMessageCountKey, kCountedLater}}};
        static const SummaryKeys keys(entries);
        Dictionary payload = keys.payload(entries);
        if (!vocoders_.empty()) {
            payload.set("vocoders", joined(vocoders_));
        }
        return payload;
    }

    Dictionary previousValues_;
    std::optional<Value> process_;
    Seconds minimum_;
    KeyPlaces places_{kKeys};
    /// The latest value of each key, up to the message before the one at hand.
    Fields state_;
    bool isRunning_ = false;
    SegmentStart start_;
    std::set<std::string> vocoders_; ///< of the stretch, each with its sample rate: "NAME:RATE"
    DerivedMessages derived_{kWords};
};

/// One walk for the session, with bursts folded.
Derivation<InputWalk> walk(const std::shared_ptr<ZRReportingSession>& session, std::optional<Value> process,
                           Seconds minimum) {
    return Derivation(InputWalk(previousValuesOf(session, kKeys), std::move(process), minimum),
                      rapidSpatialAudioSettings(kLongestPauseInBurst));
}

} // namespace

bool ZRReportingSessionInputMessagesWorker::stopSome() {
    return stopPart(stopLeft_, [this] {
        const std::shared_ptr<ZRReportingSession> owner = session();
        return derivingStop(owner, "input summary event",
                            walk(owner, applicationOf(owner), leastLengthOf(owner)));
    });
}

std::vector<MessageRef> ZRReportingSessionInputMessagesWorker::createInputMessages(
    const std::vector<MessageRef>& messages, const Value* process, Seconds minimumRunningtime) const {
    return derivedBy(
        walk(session(), process != nullptr ? std::optional(*process) : std::nullopt, minimumRunningtime),
        messages);
}

} // namespace tamblo
