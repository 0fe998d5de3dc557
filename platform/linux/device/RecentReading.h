#pragma once

#include "base/Mutex.h"

#include <chrono>
#include <functional>
#include <optional>
#include <utility>

namespace tamblo {

/// The clock that ages of readings are measured with.
using SteadyNow = std::function<std::chrono::steady_clock::time_point()>;

/// What was read last from something that is slow to read, and how long that will do: thousands of sessions
/// may stop within a second and ask for the same figure. Member of whoever reads; any thread. Who asks while
/// another reads waits for that reading.
template <typename T> class RecentReading {
public:
    RecentReading(std::chrono::milliseconds validity, SteadyNow now)
        : validity_(validity), now_(std::move(now)) {}

    /// The last reading, or a new one by calling `read` when there is none that is recent enough.
    template <typename Read> [[nodiscard]] T get(const Read& read) {
        const MutexLock lock(mutex_);
        if (!reading_ || now_() - readAt_ >= validity_) {
            reading_ = read();
            readAt_ = now_();
        }
        return *reading_;
    }

private:
    const std::chrono::milliseconds validity_;
    const SteadyNow now_;
    Mutex mutex_;
    std::optional<T> reading_ TAMBLO_GUARDED_BY(mutex_);
    std::chrono::steady_clock::time_point readAt_ TAMBLO_GUARDED_BY(mutex_);
};

} // namespace tamblo
