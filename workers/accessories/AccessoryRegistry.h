#pragma once

#include "base/Dictionary.h"
#include "base/Value.h"
#include "platform/Accessories.h"
#include "platform/Clock.h"

#include <chrono>
#include <cstddef>
#include <optional>
#include <span>
#include <vector>

namespace tamblo {

/// What is kept of accessories across restarts, a dictionary by the accessories' identifiers:
///
///     "3f1c…": {"first_seen": "2026-03-01", "last_seen": "2026-11-21", "last_reported": 1795266549.1}
///
/// Days are of UTC. The dictionary lies where anybody who runs the device may edit it: an entry of another
/// shape counts as none. Any thread: it is a function of what it is given.
struct AccessoryRegistry {
    /// An accessory is reported again after this time at the earliest.
    static constexpr std::chrono::hours kReportInterval{24};
    /// Accessories kept; beyond that, those that were not seen for the longest time are forgotten.
    static constexpr std::size_t kMostAccessories = 64;

    /// What one look at the accessories comes to.
    struct Update {
        Dictionary registered;           ///< to be kept from now on
        std::vector<Dictionary> reports; ///< the payload of one event for each accessory that is due
        bool hadRubbish = false;         ///< something that was kept was no registry, or no entry of one
    };

    /// The outcome of having seen these accessories, of which no more than are kept count.
    [[nodiscard]] static Update update(const std::optional<Value>& kept, std::span<const Accessory> seen,
                                       WallTime now);
};

} // namespace tamblo
