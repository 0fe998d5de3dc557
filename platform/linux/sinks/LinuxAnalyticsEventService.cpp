#include "platform/linux/sinks/LinuxAnalyticsEventService.h"

#include "base/Json.h"

namespace tamblo {

LinuxAnalyticsEventService::LinuxAnalyticsEventService(const std::string& logsDirectory, const Clock& clock,
                                                       const LinuxPreferences& preferences,
                                                       StructuredLog& log, FileOperations& operations)
    : clock_(clock),
      eventsInUse_(preferences, log),
      file_(logsDirectory + "/analytics-events.jsonl", "zrrs", log, operations) {}

bool LinuxAnalyticsEventService::isEventInUse(std::string_view eventName) {
    return eventsInUse_.contains(eventName);
}

void LinuxAnalyticsEventService::sendEventLazy(std::string_view eventName,
                                               const std::function<Dictionary()>& payload) {
    if (!eventsInUse_.contains(eventName)) {
        return;
    }
    // Before the lock: the provider is foreign code.
    Dictionary values = payload();
    const std::lock_guard lock(mutex_);
    if (!hasLastPayload_ || !values.sharesStorageWith(lastPayload_)) {
        hasLastPayload_ = false;
        formatPayload(values);
        lastPayload_ = std::move(values);
        hasLastPayload_ = true;
    }
    file_.append([this, eventName](TextBuffer& line) {
        const std::string_view text = lastText_.view();
        line.append(text.substr(0, lastTextBeforeName_));
        appendJsonString(line, eventName);
        line.append(text.substr(lastTextBeforeName_));
    });
}

void LinuxAnalyticsEventService::formatPayload(const Dictionary& payload) {
    lastText_.clear();
    lastText_.append("{\"time\":");
    appendJsonNumber(lastText_, secondsSince1970(clock_.now()));
    lastText_.append(",\"event\":");
    lastTextBeforeName_ = lastText_.size();
    lastText_.append(",\"payload\":");
    appendJson(lastText_, payload);
    lastText_.append('}');
}

void LinuxAnalyticsEventService::flush() {
    {
        const std::lock_guard lock(mutex_);
        lastPayload_ = Dictionary();
        hasLastPayload_ = false;
    }
    file_.flush();
}

} // namespace tamblo
