#include "platform/linux/sinks/EventsInUse.h"

#include "base/Format.h"

#include <algorithm>
#include <cstring>
#include <optional>
#include <utility>

namespace tamblo {

namespace {

constexpr std::string_view kDomain = "com.vandra.tamblo.analytics";
constexpr std::string_view kKey = "events_in_use";

std::uint64_t load(const char* bytes) noexcept {
    std::uint64_t word = 0;
    std::memcpy(&word, bytes, sizeof word);
    return word;
}

/// Names differ in their last words: the product, the category and the type. Those three dozen bytes and the
/// length tell them apart well; names that agree in them merely share a place to begin looking.
std::size_t hashOf(std::string_view name) noexcept {
    constexpr std::uint64_t kFactor = 0x9E3779B97F4A7C15U;
    std::uint64_t hash = name.size() * kFactor;
    const std::size_t words = std::min<std::size_t>(name.size() / 8, 5);
    const char* end = name.data() + name.size();
    for (std::size_t word = 1; word <= words; ++word) {
        hash = (hash ^ load(end - 8 * word)) * kFactor;
        hash ^= hash >> 32U;
    }
    if (words == 0) {
        for (const char character : name) {
            hash = (hash ^ static_cast<unsigned char>(character)) * kFactor;
        }
    }
    return static_cast<std::size_t>(hash ^ hash >> 29U);
}

} // namespace

struct EventsInUse::Answer {
    explicit Answer(std::string_view eventName) : name(eventName) {}

    const std::string name;
    /// The generation of the preferences for which this is the answer, times two, plus one if in use.
    std::atomic<std::uint64_t> state{0};
};

EventsInUse::EventsInUse(const LinuxPreferences& preferences, StructuredLog& log)
    : preferences_(preferences), log_(log), slots_(std::make_unique<std::atomic<Answer*>[]>(kSlots)) {}

EventsInUse::~EventsInUse() {
    for (std::size_t slot = 0; slot < kSlots; ++slot) {
        delete slots_[slot].load(std::memory_order_relaxed);
    }
}

bool EventsInUse::contains(std::string_view eventName) {
    const std::uint64_t generation = preferences_.generation();
    std::size_t slot = hashOf(eventName) % kSlots;
    // At least half of the slots stay free, so the search ends.
    while (const Answer* answer = slots_[slot].load(std::memory_order_acquire)) {
        if (answer->name == eventName) {
            const std::uint64_t state = answer->state.load(std::memory_order_relaxed);
            if (state >> 1U == generation) {
                return (state & 1U) != 0;
            }
            break;
        }
        slot = (slot + 1) % kSlots;
    }
    return workOut(eventName, slot, generation);
}

/// Answers for a name that is not remembered, or was answered for other preferences. The search goes on from
/// the slot where it stopped: another thread may have filled it meanwhile.
bool EventsInUse::workOut(std::string_view eventName, std::size_t slot, std::uint64_t generation) {
    const std::lock_guard lock(mutex_);
    if (generation > patternsGeneration_) {
        readPatterns(generation);
    }
    const bool isInUse = matches(eventName);
    Answer* answer = slots_[slot].load(std::memory_order_relaxed);
    while (answer != nullptr && answer->name != eventName) {
        slot = (slot + 1) % kSlots;
        answer = slots_[slot].load(std::memory_order_relaxed);
    }
    if (answer == nullptr && answers_ < kMaximumAnswers) {
        answer = new Answer(eventName);
        ++answers_;
        slots_[slot].store(answer, std::memory_order_release);
    }
    if (answer != nullptr) {
        answer->state.store(patternsGeneration_ << 1U | (isInUse ? 1U : 0U), std::memory_order_relaxed);
    }
    return isInUse;
}

void EventsInUse::readPatterns(std::uint64_t generation) {
    patternsGeneration_ = generation;
    names_.clear();
    prefixes_.clear();
    const std::optional<Value> value = preferences_.copyPreferenceValue(kKey, kDomain);
    allInUse_ = !value || !value->isArray();
    bool isMalformed = value && !value->isArray();
    if (!allInUse_) {
        for (const Value& element : value->arrayValue()) {
            const std::string_view pattern = element.stringValue();
            isMalformed = isMalformed || !element.isString();
            if (pattern.ends_with('*')) {
                prefixes_.emplace_back(pattern.substr(0, pattern.size() - 1));
            } else if (element.isString()) {
                names_.emplace_back(pattern);
            }
        }
        std::sort(names_.begin(), names_.end());
    }
    // Told once, however often other preferences change.
    if (!isMalformed) {
        reported_.reset();
    } else if (std::exchange(reported_, value) != value) {
        log_.report(LogLevel::error, "zrrs",
                    formatted("{}: {} {}", preferences_.path(kDomain), kKey,
                              allInUse_ ? "is no array; all analytics events are in use"
                                        : "holds what is no name; that is ignored"));
    }
}

bool EventsInUse::matches(std::string_view eventName) const noexcept {
    if (allInUse_ || std::binary_search(names_.begin(), names_.end(), eventName, std::less<>())) {
        return true;
    }
    return std::any_of(prefixes_.begin(), prefixes_.end(),
                       [eventName](const std::string& prefix) { return eventName.starts_with(prefix); });
}

} // namespace tamblo
