#include "session/MessageIntake.h"

#include "util/MessageKeys.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <utility>

namespace tamblo::intake {

namespace {

constexpr double kOldestAcceptedAge = 31'536'000; // seconds: 365 days

/// How far the coarse time is behind at most; what is nearer to the limit is looked at exactly.
constexpr std::chrono::milliseconds kCoarseness{20};

/// Key sets that take more memory are no ordinary messages' and are not remembered.
constexpr std::size_t kMostBytesOfKeys = 8192;

bool isTooOld(const Value& timestamp, WallTime now) noexcept {
    return timestamp.doubleValue() < secondsSince1970(now) - kOldestAcceptedAge;
}

bool isNoName(const Value& appName) noexcept {
    return appName.stringValue() == "Unknown";
}

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
    if (const Value* timestamp = payload.find(ZRReportingInternalEventEpochTime)) {
        if (!isTooOld(*timestamp, now)) {
            return;
        }
        payload.set(kInvalidTimestampKey, Value(*timestamp));
    } else {
        payload.set(kInvalidTimestampKey, "nil");
    }
    payload.set(ZRReportingInternalEventEpochTime, secondsSince1970(now));
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
    payload = Dictionary::fromMap(cleaned, kMostKeysAdded);
}

void addAudioMessageTag(Dictionary& payload, const Value& tag) {
    payload.set(kAudioTagKey, tag);
}

void addAppName(Dictionary& payload, const Value& appName) {
    const Value* present = payload.find(ZRReportingApplicationName);
    if (present == nullptr || isNoName(*present)) {
        payload.set(ZRReportingApplicationName, appName);
    }
}

void Normaliser::normalise(Dictionary& payload, const Value& tag, const Value& appName, const Clock& clock) {
    const KeySet& keys = payload.keys();
    if (keys.heldBytes() <= kMostBytesOfKeys) {
        const Plan& plan =
            plans_.get(reinterpret_cast<std::uintptr_t>(&keys), [&keys] { return makePlan(keys); });
        if (follow(plan, payload, tag, appName, clock.coarseNow() + kCoarseness)) {
            return;
        }
    }
    addMissingDates(payload, clock.now());
    removeWhiteSpaceFromKeys(payload);
    addAudioMessageTag(payload, tag);
    addAppName(payload, appName);
}

Normaliser::Plan Normaliser::makePlan(const KeySet& keys) {
    Plan plan{.arrived = KeySetRef(&keys), .complete = {}};
    plan.timestamp = keys.find(ZRReportingInternalEventEpochTime);
    if (plan.timestamp == KeySet::kNotFound || keys.anyKeyHasSpace() ||
        keys.find(kAudioTagKey) != KeySet::kNotFound) {
        return plan;
    }
    plan.complete = keys.adding(kAudioTagKey).keys;
    plan.addsAppName = keys.find(ZRReportingApplicationName) == KeySet::kNotFound;
    if (plan.addsAppName) {
        plan.complete = plan.complete->adding(ZRReportingApplicationName).keys;
    }
    plan.tag = plan.complete->find(kAudioTagKey);
    plan.appName = plan.complete->find(ZRReportingApplicationName);
    return plan;
}

/// Whether that was all there is to do; nothing is changed where it is not.
bool Normaliser::follow(const Plan& plan, Dictionary& payload, const Value& tag, const Value& appName,
                        WallTime now) {
    if (!plan.complete || isTooOld(payload.valueAt(plan.timestamp), now)) {
        return false;
    }
    if (plan.addsAppName) {
        // The order of the two keys.
        static_assert(ZRReportingApplicationName < kAudioTagKey);
        const std::array<Dictionary::Addition, 2> added{{{plan.appName, appName}, {plan.tag, tag}}};
        payload.addKeys(plan.complete, added);
        return true;
    }
    const std::array<Dictionary::Addition, 1> added{{{plan.tag, tag}}};
    payload.addKeys(plan.complete, added);
    if (isNoName(payload.valueAt(plan.appName))) {
        payload.setValueAt(plan.appName, appName);
    }
    return true;
}

bool isRepetition(const Dictionary& earlier, const Dictionary& payload) noexcept {
    return earlier.equalsIgnoring(payload, kKeysOfTimes);
}

double epochTime(const Dictionary& payload) noexcept {
    const Value* timestamp = payload.find(ZRReportingInternalEventEpochTime);
    return timestamp != nullptr ? timestamp->doubleValue() : 0.0;
}

} // namespace tamblo::intake
