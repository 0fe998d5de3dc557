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

/// Records the events that are in use: all of them, or those that a test names. Can be made to fail, and then
/// records nothing and takes no payload.
class FakeAnalyticsEventService final : public AnalyticsEventService {
public:
    struct Event {
        std::string name;
        Dictionary payload;
    };

    [[nodiscard]] bool isEventInUse(std::string_view eventName) override {
        const std::lock_guard held(mutex_);
        asked_.emplace_back(eventName);
        return isWanted(eventName);
    }
    [[nodiscard]] std::uint64_t inUseGeneration() const noexcept override { return generation_; }
    void sendEventLazy(std::string_view eventName, const std::function<Dictionary()>& payload) override {
        const std::lock_guard held(mutex_);
        if (!failing_ && isWanted(eventName)) {
            ++payloadsTaken_;
            events_.push_back({std::string(eventName), payload()});
        }
    }

    void setEventsInUse(std::optional<std::set<std::string, std::less<>>> names) {
        const std::lock_guard held(mutex_);
        inUse_ = std::move(names);
        ++generation_;
    }
    void setFailing(bool failing) noexcept { failing_ = failing; }
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
    /// Every name that was asked about, in order.
    [[nodiscard]] std::vector<std::string> asked() const {
        const std::lock_guard held(mutex_);
        return asked_;
    }
    [[nodiscard]] int payloadsTaken() const noexcept { return payloadsTaken_; }
    void clear() {
        const std::lock_guard held(mutex_);
        events_.clear();
        asked_.clear();
        payloadsTaken_ = 0;
    }

private:
    [[nodiscard]] bool isWanted(std::string_view eventName) const {
        return !inUse_ || inUse_->contains(eventName);
    }

    std::atomic<bool> failing_{false};
    std::atomic<int> payloadsTaken_{0};
    std::atomic<std::uint64_t> generation_{1};
    mutable std::mutex mutex_;
    std::optional<std::set<std::string, std::less<>>> inUse_;
    std::vector<Event> events_;
    std::vector<std::string> asked_;
};

} // namespace tamblo
