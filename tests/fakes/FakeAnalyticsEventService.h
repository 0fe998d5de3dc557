#pragma once

#include "platform/AnalyticsEventService.h"

#include <atomic>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo {

/// Records every event that it is sent: those who send are to ask first which ones are in use. All are,
/// unless a test names some.
class FakeAnalyticsEventService final : public AnalyticsEventService {
public:
    struct Event {
        std::string name;
        Dictionary payload;
    };

    [[nodiscard]] bool isEventInUse(std::string_view eventName) override {
        const std::lock_guard held(mutex_);
        return !inUse_ || inUse_->contains(eventName);
    }
    [[nodiscard]] std::uint64_t inUseGeneration() const noexcept override { return generation_; }
    void sendEventLazy(std::string_view eventName, const std::function<Dictionary()>& payload) override {
        const std::lock_guard held(mutex_);
        events_.push_back({std::string(eventName), payload()});
    }

    void setEventsInUse(std::optional<std::set<std::string, std::less<>>> names) {
        const std::lock_guard held(mutex_);
        inUse_ = std::move(names);
        ++generation_;
    }
    [[nodiscard]] std::vector<Event> events() const {
        const std::lock_guard held(mutex_);
        return events_;
    }
    /// The payloads of the events of this name.
    [[nodiscard]] std::vector<Dictionary> payloads(std::string_view eventName) const {
        std::vector<Dictionary> found;
        for (const Event& event : events()) {
            if (event.name == eventName) {
                found.push_back(event.payload);
            }
        }
        return found;
    }
    void clear() {
        const std::lock_guard held(mutex_);
        events_.clear();
    }

private:
    std::atomic<std::uint64_t> generation_{1};
    mutable std::mutex mutex_;
    std::optional<std::set<std::string, std::less<>>> inUse_;
    std::vector<Event> events_;
};

} // namespace tamblo
