#pragma once

#include "base/Mutex.h"
#include "base/Utf8.h"
#include "platform/Clock.h"

#include <cstddef>
#include <deque>
#include <new>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// The last error lines of the log, for whoever asks how the service is. Any thread; the lock is held for a
/// copy.
class LastErrors {
public:
    static constexpr std::size_t kMostLines = 16;
    static constexpr std::size_t kMostBytesOfLine = 512;
    struct Line {
        WallTime time;
        std::string category;
        std::string text;
    };

    /// It is left out when there is no memory for it.
    void add(WallTime time, std::string_view category, std::string_view text) noexcept {
        const MutexLock lock(mutex_);
        try {
            lines_.push_back({time, std::string(category), std::string(cutUtf8(text, kMostBytesOfLine))});
        } catch (const std::bad_alloc&) {
            return;
        }
        if (lines_.size() > kMostLines) {
            lines_.pop_front();
        }
    }
    /// Oldest first.
    [[nodiscard]] std::vector<Line> lines() const {
        const MutexLock lock(mutex_);
        return {lines_.begin(), lines_.end()};
    }

private:
    mutable Mutex mutex_;
    std::deque<Line> lines_ TAMBLO_GUARDED_BY(mutex_);
};

} // namespace tamblo
