#pragma once

#include "base/Dictionary.h"

#include <cstdint>
#include <string_view>

namespace tamblo {

/// The device's power-event log: what used power, and for whom. Any thread; does not block, and what cannot
/// be recorded is the log's own to report.
class PowerEventLog {
public:
    virtual ~PowerEventLog() = default;
    /// Records one event of a subsystem, by the subsystem's number.
    virtual void postRegisteredPowerEvent(std::uint32_t subsystem, std::string_view eventName,
                                          const Dictionary& payload) = 0;
};

} // namespace tamblo
