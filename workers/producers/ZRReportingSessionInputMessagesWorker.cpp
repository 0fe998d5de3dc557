#include "workers/producers/ZRReportingSessionInputMessagesWorker.h"

#include "session/ZRReportingSession.h"
#include "util/Log.h"
#include "util/MessageKeys.h"
#include "util/ReportingUtilities.h"
#include "workers/producers/PayloadFields.h"
#include "workers/producers/SegmentWalk.h"

#include <memory>
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

constexpr std::string_view kFunction = "createInputMessages";

const Dictionary& defaults() {
    static const Dictionary values{{kActiveDevicesKey, kUnknownSetting},
                                   {kOperationModeKey, kUnknownSetting},
                                   {kInputPortKey, kUnknownSetting},
                                   {kVocoderRateKey, kUnknownSetting},
                                   {kVocoderKey, kUnknownSetting}};
    return values;
}

/// The vocoders of a stretch, each with its sample rate: "NAME:RATE", in the order of their bytes.
class Vocoders {
public:
    void add(const Value& name, const Value* rate) {
        std::string rateText;
        appendText(rateText, OptionalValue{rate});
        // A rate that begins so stands for a vocoder that does not run.
        if (!rateText.starts_with("0.")) {
            std::string entry;
            appendText(entry, name);
            entries_.insert(entry + ":" + rateText);
        }
    }
    void clear() { entries_.clear(); }
    [[nodiscard]] bool empty() const noexcept { return entries_.empty(); }
    [[nodiscard]] std::string text() const {
        std::string joined;
        for (const std::string& entry : entries_) {
            joined += joined.empty() ? entry : "," + entry;
        }
        return joined;
    }

private:
    std::set<std::string> entries_;
};

/// One walk over a session's messages. It always begins with input not running: what earlier runs of the
/// session left opens no segment.
class InputWalk {
public:
    InputWalk(Dictionary previousValues, const Value* process, Seconds minimum)
        : previousValues_(std::move(previousValues)), process_(process), minimum_(minimum) {
        state_ = Fields(defaults(), places_);
        state_.merge(Fields(previousValues_, places_));
    }

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

    [[nodiscard]] std::vector<MessageRef> finish() {
        log::debug(ZRReportingSessionCategory(),
                   "returning input messages { func={}, action=return, count={} }", kFunction,
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
        if (isPresentAndHasChanged(message[Field::vocoder], state_[Field::vocoder])) {
            vocoders_.add(*message[Field::vocoder], message[Field::vocoderRate]);
        }
    }

    void endSegment(const Value* timestamp) {
        const Seconds runningTime = start_.until(timestamp);
        log::debug(ZRReportingSessionCategory(), "{}",
                   SegmentTimes{"runningTime", kFunction, start_, timestamp});
        if (timestamp != nullptr && start_.isKnown() && process_ != nullptr && runningTime > minimum_) {
            derived_.add(summary(runningTime), AudioEventKindInput);
            vocoders_.clear();
            log::debug(ZRReportingSessionCategory(), "added input message { func={}, action=add, count={} }",
                       kFunction, derived_.count());
        } else {
            // The vocoders stay for the next segment.
            log::debug(ZRReportingSessionCategory(),
                       "skipped input message, too short { func={}, action=skip, count={} }", kFunction,
                       derived_.count());
        }
        start_.begin(timestamp);
    }

    [[nodiscard]] Dictionary summary(Seconds runningTime) const {
        Dictionary payload{{ZRReportingApplicationName, *process_},
                           {"inputrunning_seconds", singleSeconds(runningTime)},
                           {"inputrunning_secondsBucketed", timeBucketText(runningTime)},
                           {kMessageIndexKey, derived_.nextIndex()},
                           {kOperationModeKey, *state_[Field::operationMode]},
                           {kInputPortKey, *state_[Field::inputPort]},
                           {kActiveDevicesKey, *state_[Field::devices]}};
        if (!vocoders_.empty()) {
            payload.set("vocoders", vocoders_.text());
        }
        return payload;
    }

    const Dictionary previousValues_;
    const Value* const process_;
    const Seconds minimum_;
    KeyPlaces places_{kKeys};
    /// The latest value of each key, up to the message before the one at hand.
    Fields state_;
    bool isRunning_ = false;
    SegmentStart start_;
    Vocoders vocoders_;
    DerivedMessages derived_;
};

} // namespace

void ZRReportingSessionInputMessagesWorker::stop() {
    deriveAtStop(session(), "input summary event", [this](const ZRReportingSession& owner, Seconds minimum) {
        const Value process = ZRReportingUtilityRetrieveAppName(owner.configuration());
        return createInputMessages(owner.messages(), &process, minimum);
    });
}

std::vector<MessageRef> ZRReportingSessionInputMessagesWorker::createInputMessages(
    const std::vector<MessageRef>& messages, const Value* process, Seconds minimumRunningtime) const {
    log::debug(ZRReportingSessionCategory(), "entering createInputMessages {}", kFunction);
    const std::shared_ptr<ZRReportingSession> owner = session();
    InputWalk walk(owner != nullptr ? owner->previousValues() : Dictionary(), process, minimumRunningtime);
    for (const ZRReportingSessionMessage* message :
         combineSpatialAudioSettings(messages, kLongestPauseInBurst)) {
        walk.take(message->payload());
    }
    return walk.finish();
}

} // namespace tamblo
