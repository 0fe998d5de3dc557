#pragma once

#include "base/Dictionary.h"

#include <cstdint>
#include <functional>
#include <span>
#include <string_view>

namespace tamblo {

/// The analytics-event service: collects named events with a payload. Any thread; neither operation blocks,
/// and what cannot be recorded is the service's own to report.
class AnalyticsEventService {
public:
    virtual ~AnalyticsEventService() = default;
    /// Whether events of this name are collected now.
    [[nodiscard]] virtual bool isEventInUse(std::string_view eventName) = 0;
    /// Another number once `isEventInUse` may answer otherwise: its answers hold for as long as this stays
    /// the same. Never 0. To be read before they are asked for.
    [[nodiscard]] virtual std::uint64_t inUseGeneration() const = 0;
    /// Records one event. The provider is called at most once, only if the event is recorded, and before this
    /// returns; what it returns is the event's payload as of then.
    void sendEventLazy(std::string_view eventName, const std::function<Dictionary()>& payload) {
        sendEventsLazy({&eventName, 1}, payload);
    }
    /// The same for several events that have one payload.
    virtual void sendEventsLazy(std::span<const std::string_view> eventNames,
                                const std::function<Dictionary()>& payload) = 0;
};

} // namespace tamblo
