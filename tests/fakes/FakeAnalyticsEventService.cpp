#include "tests/fakes/FakeAnalyticsEventService.h"

#include <utility>

namespace tamblo {

bool FakeAnalyticsEventService::isWanted(std::string_view eventName) const {
    return !inUse_ || inUse_->contains(eventName);
}

bool FakeAnalyticsEventService::isEventInUse(std::string_view eventName) {
    const std::lock_guard held(mutex_);
    asked_.emplace_back(eventName);
    return isWanted(eventName);
}

void FakeAnalyticsEventService::sendEventLazy(std::string_view eventName,
                                              const std::function<Dictionary()>& payload) {
    const std::lock_guard held(mutex_);
    if (failing_ || !isWanted(eventName)) {
        return;
    }
    ++payloadsTaken_;
    events_.push_back({std::string(eventName), payload()});
}

void FakeAnalyticsEventService::setEventsInUse(std::optional<std::set<std::string, std::less<>>> names) {
    const std::lock_guard held(mutex_);
    inUse_ = std::move(names);
}

std::vector<FakeAnalyticsEventService::Event> FakeAnalyticsEventService::events() const {
    const std::lock_guard held(mutex_);
    return events_;
}

std::vector<Dictionary> FakeAnalyticsEventService::payloads(std::string_view eventName) const {
    const std::lock_guard held(mutex_);
    std::vector<Dictionary> found;
    for (const Event& event : events_) {
        if (event.name == eventName) {
            found.push_back(event.payload);
        }
    }
    return found;
}

std::vector<std::string> FakeAnalyticsEventService::asked() const {
    const std::lock_guard held(mutex_);
    return asked_;
}

void FakeAnalyticsEventService::clear() {
    const std::lock_guard held(mutex_);
    events_.clear();
    asked_.clear();
    payloadsTaken_ = 0;
}

} // namespace tamblo
