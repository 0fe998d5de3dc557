#include "workers/producers/SegmentWalk.h"

#include "base/Format.h"
#include "util/Log.h"
#include "util/MessageKeys.h"
#include "util/NumberBuckets.h"
#include "util/SummaryBuckets.h"

#include <algorithm>
#include <array>
#include <limits>
#include <memory>
#include <utility>

namespace tamblo {

namespace {

double secondsOf(const Value* timestamp) noexcept {
    return timestamp != nullptr ? timestamp->doubleValue() : 0.0;
}

/// The texts of all buckets of a table, made once.
template <std::size_t Count> class BucketTexts {
public:
    BucketTexts(const std::array<double, Count>& buckets, unsigned fractionDigits) : buckets_(buckets) {
        std::transform(buckets.begin(), buckets.end(), texts_.begin(), [&](double bucket) {
            return Value(*ZRReportingUtilityBucketNumberToString(bucket, buckets, fractionDigits));
        });
    }
    [[nodiscard]] const Value& of(double number) const noexcept {
        return texts_[*nearestBucket(number, buckets_)];
    }

private:
    const std::array<double, Count>& buckets_;
    std::array<Value, Count> texts_;
};

} // namespace

Seconds SegmentStart::until(const Value* timestamp) const noexcept {
    return Seconds(secondsOf(timestamp) - secondsOf(timestamp_));
}

bool settingsDiffer(const Value* left, const Value* right) noexcept {
    if (left == nullptr || right == nullptr) {
        return false;
    }
    if (left->isNumber() && right->isNumber()) {
        return !(*left == *right);
    }
    // A number beside a text stands for the text that it is written as; anything else for an empty one.
    const auto isAsText = [](const Value& number, const Value& text) {
        return formatted("{}", number) == text.stringValue();
    };
    if (left->isNumber() || right->isNumber()) {
        return left->isNumber() ? !isAsText(*left, *right) : !isAsText(*right, *left);
    }
    return left->stringValue() != right->stringValue();
}

bool differAsNumbers(const Value* left, const Value* right) noexcept {
    if (left == nullptr || right == nullptr) {
        return false;
    }
    // Numbers are compared exactly, beyond what a double holds; anything else by the number that it reads as.
    return left->isNumber() && right->isNumber() ? !(*left == *right)
                                                 : left->doubleValue() != right->doubleValue();
}

Value singleSeconds(Seconds length) noexcept {
    constexpr double kMost = std::numeric_limits<float>::max();
    // A far-fetched timestamp must not make a number that a float cannot hold: the language leaves open what
    // becomes of it.
    if (length.count() > kMost) {
        return std::numeric_limits<float>::infinity();
    }
    return static_cast<float>(std::max(length.count(), -kMost));
}

Value volumeBucketText(double volume) {
    static const BucketTexts texts(kVolumeBuckets, 4);
    return texts.of(volume);
}

Value timeBucketText(Seconds length) {
    static const BucketTexts texts(kTimeBuckets, 0);
    return texts.of(length.count());
}

DerivedMessages::DerivedMessages(const SegmentWords& words) : words_(words) {
    log::debug(ZRReportingSessionCategory(), "entering {} {}", words.function, words.function);
}

void DerivedMessages::logLength(const SegmentStart& start, const Value* timestamp) const {
    log::debug(ZRReportingSessionCategory(),
               "{} { func={}, {}={}, zrTimestamp={}, zrTimestamp_double={}, startZrTimestamp={}, "
               "startZrTimestamp_double={} }",
               words_.length, words_.function, words_.length, start.until(timestamp).count(), timestamp,
               secondsOf(timestamp), start.timestamp(), secondsOf(start.timestamp()));
}

ZRReportingSessionMessage& DerivedMessages::add(Dictionary payload, AudioEventCategory category) {
    messages_.push_back(
        std::make_shared<ZRReportingSessionMessage>(std::move(payload), category, AudioEventTypeSummary));
    log::debug(ZRReportingSessionCategory(), "added {} { func={}, action=add, count={} }", words_.added,
               words_.function, count());
    return *messages_.back();
}

void DerivedMessages::skip() const {
    log::debug(ZRReportingSessionCategory(), "skipped {} { func={}, action=skip, count={} }", words_.skipped,
               words_.function, count());
}

void addCount(ZRReportingSessionMessage& message, std::size_t count) {
    message.editPayload([count](Dictionary& payload) { payload.set(kMessageCountKey, count); });
}

std::unique_ptr<RapidMessages> rapidSpatialAudioSettings(Seconds longestPause) {
    static constexpr std::array<std::string_view, 2> kSettings{
        ZRReportingMessageKeySpatialAudioAccessoryFeature, kSpatializationEnabledKey};
    return std::make_unique<RapidMessages>(kSettings, longestPause);
}

Dictionary previousValuesOf(const std::shared_ptr<ZRReportingSession>& session,
                            std::span<const std::string_view> keys) {
    return session != nullptr ? session->previousValuesOf(keys) : Dictionary();
}

std::optional<Value> applicationOf(const std::shared_ptr<ZRReportingSession>& session) {
    return session != nullptr ? std::optional(ZRReportingUtilityRetrieveAppName(session->configuration()))
                              : std::nullopt;
}

Seconds leastLengthOf(const std::shared_ptr<ZRReportingSession>& session) {
    return ZRReportingUtilityVolumeMinimumPlayingTime(session != nullptr ? session->serviceType()
                                                                         : AudioServiceTypeUnknown);
}

DerivedSending::DerivedSending(ZRReportingSession& session, std::string_view what,
                               std::vector<MessageRef> derived)
    : derived_(std::move(derived)) {
    if (!derived_.empty()) {
        log::standard(ZRReportingSessionCategory(), "sending {} for reporter {}", what, session.reporterID());
    }
}

bool DerivedSending::sendSome(ZRReportingSession& session) {
    constexpr std::size_t kMessagesOfPart = 250;
    const std::size_t end = std::min(derived_.size(), sent_ + kMessagesOfPart);
    while (sent_ < end) {
        const MessageRef message = std::move(derived_[sent_++]);
        addCount(*message, derived_.size());
        session.sendMessage(message);
    }
    return sent_ == derived_.size();
}

} // namespace tamblo
