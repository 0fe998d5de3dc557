#pragma once

#include "base/Dictionary.h"
#include "util/AudioEvents.h"

#include <cstdint>
#include <vector>

namespace tamblo {

/// The summary event of a session for the call-quality service: under every key that its messages held, all
/// of the key's values, joined by commas in the messages' order, and the service type under a key of its own.
/// Its time grows with the values, not with their square: a session may have held millions of them. Once a
/// key's text has 1 MiB, or all have 4 MiB, further values are left out, with "(...)" in place of the first.
/// On any thread.
struct LinkmeterSummary {
    Dictionary values;
    std::uint64_t leftOut = 0; ///< values

    /// Of these payloads, which are let go one by one, so that the texts take the memory that they had.
    [[nodiscard]] static LinkmeterSummary of(std::vector<Dictionary> payloads, AudioServiceType serviceType);
};

} // namespace tamblo
