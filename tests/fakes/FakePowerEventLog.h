#pragma once

#include "platform/PowerEventLog.h"

#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// Keeps what is posted.
class FakePowerEventLog final : public PowerEventLog {
public:
    struct Event {
        std::uint32_t subsystem;
        std::string name;
        Dictionary payload;
    };
    void postRegisteredPowerEvent(std::uint32_t subsystem, std::string_view eventName,
                                  const Dictionary& payload) override {
        events.push_back({subsystem, std::string(eventName), payload});
    }

    std::vector<Event> events;
};

} // namespace tamblo
