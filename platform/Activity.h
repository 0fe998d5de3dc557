#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>

namespace tamblo {

/// What the service is doing, for those who run it: counts that its parts keep and the platform shows. Any
/// thread.
struct Activity {
    std::atomic<std::size_t> sessions{0};
    std::atomic<std::size_t> retainedBytes{0};    ///< of all sessions' messages
    std::atomic<std::uint64_t> droppedRecords{0}; ///< records let go for the budget of what is retained
};

} // namespace tamblo
