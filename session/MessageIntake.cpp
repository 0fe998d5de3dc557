#include "session/MessageIntake.h"

#include "util/MessageKeys.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <utility>

namespace tamblo::intake {

namespace {

constexpr double kOldestAcceptedAge = 31'536'000; // seconds: 365 days

/// The audio tag and the application's name.
constexpr std::size_t kKeysAddedAfterwards = 2;

/// Differ between two messages that say the same.
constexpr std::array<std::string_view, 3> kKeysOfTimes{ZRReportingInternalEventProcessUptimeMS,
                                                       ZRReportingInternalEventSystemUptimeSec,
                                                       ZRReportingInternalEventEpochTime};

} // namespace

const Value& AudioTags::of(AudioEventCategory category, AudioEventType type) {
    const std::uint64_t key = (std::uint64_t{1} << 48U) | (std::uint64_t{category} << 16U) | type;
    return tags_.get(key, [&] {
        std::string tag = ZRReportingUtilityCategoryString(category);
        tag += ZRReportingUtilityTypeString(type);
        return Value(tag);
    });
}

void addMissingDates(Dictionary& payload, WallTime now) {
    const double seconds = secondsSince1970(now);
    if (const Value* timestamp = payload.find(ZRReportingInternalEventEpochTime)) {
        if (!(timestamp->doubleValue() < seconds - kOldestAcceptedAge)) {
            return;
        }
        payload.set(kInvalidTimestampKey, Value(*timestamp));
    } else {
        payload.set(kInvalidTimestampKey, "nil");
    }
    payload.set(ZRReportingInternalEventEpochTime, seconds);
}

void removeWhiteSpaceFromKeys(Dictionary& payload) {
    if (!payload.keys().anyKeyHasSpace()) {
        return;
    }
    // Built anew at once: key by key, the time would grow with the square of their number, which is a
    // client's choice. The keys with a space come second, as their values win.
    std::map<std::string, Value> cleaned;
    for (const bool hasSpace : {false, true}) {
        for (std::size_t i = 0; i < payload.size(); ++i) {
            std::string key(payload.keyAt(i));
            if ((key.find(' ') != std::string::npos) == hasSpace) {
                std::replace(key.begin(), key.end(), ' ', '_');
                cleaned.insert_or_assign(std::move(key), payload.valueAt(i));
            }
        }
    }
    payload = Dictionary::fromMap(cleaned, kKeysAddedAfterwards);
}

void addAudioMessageTag(Dictionary& payload, const Value& tag) {
    payload.set(kAudioTagKey, tag);
}

void addAppName(Dictionary& payload, const Value& appName) {
    const Value* present = payload.find(ZRReportingApplicationName);
    if (present == nullptr || present->stringValue() == "Unknown") {
        payload.set(ZRReportingApplicationName, appName);
    }
}

bool isRepetition(const Dictionary& earlier, const Dictionary& payload) noexcept {
    return earlier.equalsIgnoring(payload, kKeysOfTimes);
}

double epochTime(const Dictionary& payload) noexcept {
    const Value* timestamp = payload.find(ZRReportingInternalEventEpochTime);
    return timestamp != nullptr ? timestamp->doubleValue() : 0.0;
}

} // namespace tamblo::intake
