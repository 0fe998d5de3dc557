#pragma once

#include "base/Dictionary.h"
#include "base/UniqueFunction.h"
#include "session/ZRReportingSession.h"
#include "session/ZRReportingSessionMessage.h"
#include "util/AudioEvents.h"
#include "workers/ZRReportingSessionWorkerUtility.h"

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string_view>
#include <utility>
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
/// What stands under the latter until the walk is over.
inline constexpr std::uint64_t kCountedLater = 0;

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

// Wherever two values are compared, one that is absent is unchanged.
/// Two numbers are compared as numbers, a number with a text as it is written, anything else as texts.
[[nodiscard]] bool settingsDiffer(const Value* left, const Value* right) noexcept;
/// Anything but a number by the number that it reads as.
[[nodiscard]] bool differAsNumbers(const Value* left, const Value* right) noexcept;

/// A length of time as summaries carry it, in single precision.
[[nodiscard]] Value singleSeconds(Seconds length) noexcept;
/// The class that a volume, or a length of time, falls into.
[[nodiscard]] Value volumeBucketText(double volume);
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
    /// All of them, which are yet to be told how many there are.
    [[nodiscard]] std::vector<MessageRef> take() noexcept { return std::move(messages_); }

private:
    const SegmentWords& words_;
    std::vector<MessageRef> messages_;
};

/// Tells one of the messages of a walk how many there are.
void addCount(ZRReportingSessionMessage& message, std::size_t count);

/// What folds bursts of the two spatial-audio settings.
[[nodiscard]] std::unique_ptr<RapidMessages> rapidSpatialAudioSettings(Seconds longestPause);

/// What a walk begins with under its keys: what the session's earlier runs left, nothing once the session is
/// gone.
[[nodiscard]] Dictionary previousValuesOf(const std::shared_ptr<ZRReportingSession>& session,
                                          std::span<const std::string_view> keys);
/// The application that the session's summaries name; none once the session is gone.
[[nodiscard]] std::optional<Value> applicationOf(const std::shared_ptr<ZRReportingSession>& session);

/// A walk and what it derives of messages, bursts folded where that is asked for; a part at a time, since a
/// session may have hundreds of thousands. The messages must not change in between. Most of them do not
/// concern a walk, which their keys tell.
template <typename Walk> class Derivation {
public:
    /// A part ends once it has looked at so many messages, walked over so many, or derived so many.
    static constexpr std::size_t kMostLookedAt = 10'000;
    static constexpr std::size_t kMostWalked = 2'000;
    static constexpr std::size_t kMostDerived = 500;

    explicit Derivation(Walk walk, std::unique_ptr<RapidMessages> rapid = nullptr)
        : walk_(std::move(walk)), rapid_(std::move(rapid)) {}

    /// Does the next part. `keySets` are those of the first messages, or of none. Whether all is done.
    [[nodiscard]] bool deriveSome(std::span<const MessageRef> messages, std::span<const KeySet*> keySets) {
        if (rapid_ && folded_ < messages.size()) {
            foldSome(messages, keySets);
            return false;
        }
        const std::size_t end = endOfPart(looked_, messages.size());
        const std::size_t mostDerived = walk_.derivedCount() + kMostDerived;
        for (std::size_t walked = 0;
             looked_ < end && walked < kMostWalked && walk_.derivedCount() < mostDerived; ++looked_) {
            if (takenInSeen_ < takenIn_.size() && takenIn_[takenInSeen_] == looked_) {
                ++takenInSeen_;
            } else if (walk_.isConcernedBy(keysOf(messages, keySets, looked_))) {
                walk_.take(messages[looked_]->payload());
                ++walked;
            }
        }
        return looked_ == messages.size();
    }
    /// What was derived of all.
    [[nodiscard]] std::vector<MessageRef> finish() { return walk_.finish(); }
    [[nodiscard]] std::size_t derivedCount() const noexcept { return walk_.derivedCount(); }

private:
    void foldSome(std::span<const MessageRef> messages, std::span<const KeySet*> keySets) {
        const std::size_t end = endOfPart(folded_, messages.size());
        for (std::size_t added = 0; folded_ < end && added < kMostWalked; ++folded_) {
            if (!rapid_->concerns(keysOf(messages, keySets, folded_))) {
                continue;
            }
            ++added;
            const std::optional<std::size_t> taking = rapid_->add(messages, folded_);
            if (taking) {
                takenIn_.push_back(folded_);
                if (*taking < keySets.size()) {
                    keySets[*taking] = &messages[*taking]->payload().keys();
                }
            }
        }
    }
    [[nodiscard]] static const KeySet& keysOf(std::span<const MessageRef> messages,
                                              std::span<const KeySet*> keySets, std::size_t place) noexcept {
        return place < keySets.size() ? *keySets[place] : messages[place]->payload().keys();
    }
    [[nodiscard]] static std::size_t endOfPart(std::size_t begin, std::size_t count) noexcept {
        return std::min(count, begin + kMostLookedAt);
    }

    Walk walk_;
    std::unique_ptr<RapidMessages> rapid_; ///< null: nothing is folded
    std::size_t folded_ = 0;
    std::vector<std::size_t> takenIn_; ///< places of messages that were folded into earlier ones
    std::size_t takenInSeen_ = 0;
    std::size_t looked_ = 0;
};

/// The least length of a segment that is reported of the session.
[[nodiscard]] Seconds leastLengthOf(const std::shared_ptr<ZRReportingSession>& session);

/// All that is derived of these messages.
template <typename Walk>
[[nodiscard]] std::vector<MessageRef> derivedBy(Derivation<Walk> derivation,
                                                std::span<const MessageRef> messages) {
    while (!derivation.deriveSome(messages, {})) {
    }
    std::vector<MessageRef> derived = derivation.finish();
    for (const MessageRef& message : derived) {
        addCount(*message, derived.size());
    }
    return derived;
}

/// The next part of what is left to do of a producer's stop; whether all is done.
using PartOfStop = UniqueFunction<bool()>;

/// Sends a producer's derived messages into its session as a client would, some hundreds in one part.
class DerivedSending {
public:
    DerivedSending(ZRReportingSession& session, std::string_view what, std::vector<MessageRef> derived);
    /// Whether all are sent.
    [[nodiscard]] bool sendSome(ZRReportingSession& session);
    [[nodiscard]] std::size_t leftCount() const noexcept { return derived_.size() - sent_; }

private:
    std::vector<MessageRef> derived_;
    std::size_t sent_ = 0;
};

/// What a producer does when its session stops: derives messages of what the session recorded and sends them
/// into it.
template <typename Walk>
[[nodiscard]] PartOfStop derivingStop(std::weak_ptr<ZRReportingSession> session, std::string_view what,
                                      Derivation<Walk> ofSession) {
    return [session = std::move(session), what,
            derivation = std::make_unique<Derivation<Walk>>(std::move(ofSession)),
            sending = std::optional<DerivedSending>()]() mutable {
        const std::shared_ptr<ZRReportingSession> owner = session.lock();
        if (owner == nullptr || (!sending && owner->messages().empty())) {
            return true;
        }
        if (sending) {
            const bool isDone = sending->sendSome(*owner);
            (void)owner->holdsDerived(sending->leftCount());
            return isDone;
        }
        const bool isDone = derivation->deriveSome(owner->messages(), owner->keySetsAtStop());
        // Where there is no room for more, what the rest would have added is left out.
        if (!owner->holdsDerived(derivation->derivedCount()) || isDone) {
            sending.emplace(*owner, what, derivation->finish());
            derivation.reset();
        }
        return false;
    };
}

/// Goes on with what is left of a stop, which `begin` makes when nothing is. Whether all is done.
template <typename Begin> [[nodiscard]] bool stopPart(PartOfStop& left, Begin begin) {
    if (!left) {
        left = begin();
    }
    if (!left()) {
        return false;
    }
    left.reset();
    return true;
}

} // namespace tamblo
