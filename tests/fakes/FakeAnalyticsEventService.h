#pragma once

#include "platform/AnalyticsEventService.h"

#include <atomic>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <string_view>
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

    [[nodiscard]] bool isEventInUse(std::string_view eventName) override;
    void sendEventLazy(std::string_view eventName, const std::function<Dictionary()>& payload) override;

    void setEventsInUse(std::optional<std::set<std::string, std::less<>>> names);
    void setFailing(bool failing) noexcept { failing_ = failing; }
    [[nodiscard]] std::vector<Event> events() const;
    /// The payloads of the events of this name.
    [[nodiscard]] std::vector<Dictionary> payloads(std::string_view eventName) const;
    /// Every name that was asked about, in order.
    [[nodiscard]] std::vector<std::string> asked() const;
    [[nodiscard]] int payloadsTaken() const noexcept { return payloadsTaken_; }
    void clear();

private:
    [[nodiscard]] bool isWanted(std::string_view eventName) const;

    std::atomic<bool> failing_{false};
    std::atomic<int> payloadsTaken_{0};
    mutable std::mutex mutex_;
    std::optional<std::set<std::string, std::less<>>> inUse_;
    std::vector<Event> events_;
    std::vector<std::string> asked_;
};

} // namespace tamblo
