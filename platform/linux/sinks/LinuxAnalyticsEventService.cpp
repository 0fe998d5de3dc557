#include "platform/linux/sinks/LinuxAnalyticsEventService.h"

#include "base/Json.h"

#include <algorithm>
#include <cstring>
#include <functional>
#include <iterator>
#include <utility>

namespace tamblo {

namespace {

/// Appends a piece of what stands in the buffer already.
void appendAgain(TextBuffer& text, std::size_t begin, std::size_t end) {
    char* const room = text.room(end - begin);
    std::memcpy(room, text.data() + begin, end - begin);
    text.commit(end - begin);
}

} // namespace

LinuxAnalyticsEventService::LinuxAnalyticsEventService(SinkFiles& sinks, const Clock& clock,
                                                       const LinuxPreferences& preferences,
                                                       StructuredLog& log)
    : clock_(clock),
      preferences_(preferences),
      preference_({.domain = "com.vandra.tamblo.analytics",
                   .key = "events_in_use",
                   .categoryCode = "zrrs",
                   .whenAbsent = {"*"},
                   .absentMeans = "all analytics events are in use"},
                  preferences, log),
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

void LinuxAnalyticsEventService::sendEventLazy(std::string_view eventName,
                                               const std::function<Dictionary()>& payload) {
    if (!isEventInUse(eventName)) {
        return;
    }
    // Before the file's lock: the provider is foreign code.
    Dictionary values = payload();
    file_.append([&](TextBuffer& lines) { format(lines, eventName, std::move(values)); });
}

void LinuxAnalyticsEventService::format(TextBuffer& lines, std::string_view eventName, Dictionary&& payload) {
    // The line that was formatted last stands there unless it was written out, or taken back as too long.
    if (lastLine_.end < lines.size() && payload.sharesStorageWith(lastLine_.payload)) {
        appendAgain(lines, lastLine_.begin, lastLine_.nameBegin);
        appendJsonString(lines, eventName);
        appendAgain(lines, lastLine_.nameEnd, lastLine_.end);
        return;
    }
    LastLine line;
    line.begin = lines.size();
    lines.append("{\"time\":");
    appendJsonNumber(lines, secondsSince1970(clock_.now()));
    lines.append(",\"event\":");
    line.nameBegin = lines.size();
    appendJsonString(lines, eventName);
    line.nameEnd = lines.size();
    lines.append(",\"payload\":");
    appendJson(lines, payload);
    lines.append('}');
    line.end = lines.size();
    line.payload = std::move(payload);
    lastLine_ = std::move(line);
}

} // namespace tamblo
