#include "platform/linux/sinks/LinuxAnalyticsEventService.h"

#include "base/Json.h"
#include "platform/Counters.h"
#include "platform/PreferenceDomains.h"

#include <algorithm>
#include <functional>
#include <iterator>
#include <utility>

namespace tamblo {

LinuxAnalyticsEventService::LinuxAnalyticsEventService(SinkFiles& sinks, const Clock& clock,
                                                       const LinuxPreferences& preferences,
                                                       StructuredLog& log)
    : clock_(clock),
      preferences_(preferences),
      preference_({.domain = kAnalyticsDomain,
                   .key = "events_in_use",
                   .categoryCode = "zrrs",
                   .whenAbsent = {"*"},
                   .absentMeans = "all analytics events are in use"},
                  preferences, log),
      texts_(sinks.payloadTexts()),
      file_(sinks, "analytics-events.jsonl", "zrrs") {
    // While there are descriptors for it: what the device forbids stays forbidden when there are none.
    const MutexLock lock(mutex_);
    readNamesInUse(preferences.generation());
}

bool LinuxAnalyticsEventService::isEventInUse(std::string_view eventName) {
    const std::uint64_t generation = preferences_.generation();
    if (allInUseIn_.load(std::memory_order_relaxed) == generation) {
        return true;
    }
    const MutexLock lock(mutex_);
    if (generation > generation_) {
        readNamesInUse(generation);
    }
    // No prefix begins with another: the one that the name may begin with is the last that is not behind it.
    const auto behind = std::upper_bound(prefixes_.begin(), prefixes_.end(), eventName, std::less<>());
    return std::binary_search(names_.begin(), names_.end(), eventName, std::less<>()) ||
           (behind != prefixes_.begin() && eventName.starts_with(*std::prev(behind)));
}

void LinuxAnalyticsEventService::readNamesInUse(std::uint64_t generation) {
    generation_ = generation;
    names_.clear();
    prefixes_.clear();
    for (std::string& pattern : preference_.read()) {
        if (pattern.ends_with('*')) {
            pattern.pop_back();
            prefixes_.push_back(std::move(pattern));
        } else {
            names_.push_back(std::move(pattern));
        }
    }
    std::sort(names_.begin(), names_.end());
    std::sort(prefixes_.begin(), prefixes_.end());
    prefixes_.erase(
        std::unique(prefixes_.begin(), prefixes_.end(),
                    [](const std::string& kept, const std::string& next) { return next.starts_with(kept); }),
        prefixes_.end());
    if (!prefixes_.empty() && prefixes_.front().empty()) {
        allInUseIn_.store(generation, std::memory_order_relaxed);
    }
}

void LinuxAnalyticsEventService::sendEventsLazy(std::span<const std::string_view> eventNames,
                                                const std::function<Dictionary()>& payload) {
    if (allInUseIn_.load(std::memory_order_relaxed) == preferences_.generation()) {
        record(eventNames, payload);
        return;
    }
    for (const std::string_view& eventName : eventNames) {
        if (isEventInUse(eventName)) {
            record({&eventName, 1}, payload);
        } else {
            counters::add(counters::Counter::eventsNotInUse);
        }
    }
}

void LinuxAnalyticsEventService::record(std::span<const std::string_view> eventNames,
                                        const std::function<Dictionary()>& payload) {
    // Before the file's lock: the provider is foreign code.
    const Dictionary values = payload();
    counters::add(counters::Counter::eventsInUse, eventNames.size());
    file_.appendLines(eventNames, [&](TextBuffer& lines, std::string_view eventName) {
        texts_.appendLine(lines, clock_, values, {}, [eventName](TextBuffer& line) {
            line.append(",\"event\":");
            appendJsonString(line, eventName);
        });
    });
}

} // namespace tamblo
