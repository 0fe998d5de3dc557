#pragma once

#include "base/Dictionary.h"
#include "session/ZRReportingSession.h"
#include "session/ZRReportingSessionMessage.h"
#include "util/AudioEvents.h"
#include "util/Log.h"

#include <chrono>
#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <vector>

/// What the producers of volume, group-session and input summaries have in common. Each walks a session's
/// messages at its stop, keeps the latest value of every key it knows (the running state), cuts the time into
/// segments wherever something that it watches changes, and derives one message from each segment that is
/// long enough. On the reporting server queue.
namespace tamblo {

using Seconds = std::chrono::duration<double>;

/// What a summary says of a text setting that nobody has reported.
inline constexpr std::string_view kUnknownSetting = "unknown";
/// The place of a summary among those of the same walk, from 1, and how many of them there are.
inline constexpr std::string_view kMessageIndexKey = "msgidx";
inline constexpr std::string_view kMessageCountKey = "msgcnt";

/// Where a segment began: the timestamp of the message that opened it, null while there is none.
class SegmentStart {
public:
    void begin(const Value* timestamp) noexcept { timestamp_ = timestamp; }
    void end() noexcept { timestamp_ = nullptr; }
    [[nodiscard]] bool isKnown() const noexcept { return timestamp_ != nullptr; }
    [[nodiscard]] const Value* timestamp() const noexcept { return timestamp_; }
    /// Time from the start to this timestamp; an absent one counts 0.
    [[nodiscard]] Seconds until(const Value* timestamp) const noexcept;

private:
    const Value* timestamp_ = nullptr;
};

/// Wherever two values are compared, one that is absent is unchanged.
[[nodiscard]] bool differAsTexts(const Value* left, const Value* right) noexcept;
[[nodiscard]] bool differAsNumbers(const Value* left, const Value* right) noexcept;

/// A length of time as summaries carry it, in single precision.
[[nodiscard]] Value singleSeconds(Seconds length) noexcept;
/// The class that a number falls into.
[[nodiscard]] Value bucketText(double number, std::span<const double> buckets, unsigned fractionDigits);
[[nodiscard]] Value timeBucketText(Seconds length);

/// How the log lines of one producer's walks name things.
struct SegmentWords {
    std::string_view function;
    std::string_view length;  ///< "playingTime"
    std::string_view added;   ///< "volume message"
    std::string_view skipped; ///< "volume message, too short"
};

/// The messages of one walk, numbered as they are added; tells the log what becomes of each segment.
class DerivedMessages {
public:
    explicit DerivedMessages(const SegmentWords& words);

    /// The number of the next one, from 1.
    [[nodiscard]] std::int64_t nextIndex() const noexcept {
        return static_cast<std::int64_t>(messages_.size()) + 1;
    }
    [[nodiscard]] std::uint64_t count() const noexcept { return messages_.size(); }
    void logLength(const SegmentStart& start, const Value* timestamp) const;
    /// A summary of this category.
    ZRReportingSessionMessage& add(Dictionary payload, AudioEventCategory category);
    void skip() const;
    /// All of them, each now knowing how many there are.
    [[nodiscard]] std::vector<MessageRef> take();

private:
    const SegmentWords& words_;
    std::vector<MessageRef> messages_;
};

/// The messages with each burst of the two spatial-audio settings folded into one.
[[nodiscard]] std::vector<ZRReportingSessionMessage*>
combineSpatialAudioSettings(const std::vector<MessageRef>& messages, Seconds longestPause);

/// What a walk begins with: what the session's earlier runs left, nothing once the session is gone.
[[nodiscard]] Dictionary previousValuesOf(const std::shared_ptr<ZRReportingSession>& session);

/// What a walk over these messages derives.
template <typename Walk, typename Messages>
[[nodiscard]] std::vector<MessageRef> derivedBy(Walk walk, const Messages& messages) {
    for (const auto& message : messages) {
        walk.take(message->payload());
    }
    return walk.finish();
}

/// What a producer does when its session stops: has `derive` make messages of what the session recorded,
/// given the session and the least length of a segment, and sends them into it as a client would.
template <typename Derive>
void deriveAtStop(const std::shared_ptr<ZRReportingSession>& session, std::string_view what, Derive derive) {
    if (session == nullptr || session->messages().empty()) {
        return;
    }
    const std::vector<MessageRef> derived =
        derive(*session, ZRReportingUtilityVolumeMinimumPlayingTime(session->serviceType()));
    if (derived.empty()) {
        return;
    }
    log::standard(ZRReportingSessionCategory(), "sending {} for reporter {}", what, session->reporterID());
    for (const MessageRef& message : derived) {
        session->sendMessage(message);
    }
}

} // namespace tamblo
