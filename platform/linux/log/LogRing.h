#pragma once

#include "base/Mutex.h"

#include <cstddef>
#include <deque>
#include <new>
#include <string>
#include <string_view>

namespace tamblo {

/// The last lines of the log, for those who want to know what led to something. Kept on every build, as the
/// log is there before it is known which. Bounded in lines and in bytes; the oldest go first. Any thread; the
/// lock is held for a copy.
class LogRing {
public:
    static constexpr std::size_t kMaximumLines = 1000;
    /// A thousand lines of a usual length several times over: at the level debug they carry whole payloads.
    static constexpr std::size_t kMaximumBytes = 1U << 20U;

    /// One line, with its line end. It is left out when there is no memory for it.
    void add(std::string_view line) noexcept {
        const MutexLock lock(mutex_);
        try {
            lines_.emplace_back(line);
        } catch (const std::bad_alloc&) {
            return;
        }
        size_ += line.size();
        while (lines_.size() > kMaximumLines || size_ > kMaximumBytes) {
            size_ -= lines_.front().size();
            lines_.pop_front();
        }
    }
    /// The lines, oldest first.
    [[nodiscard]] std::string text() const {
        const MutexLock lock(mutex_);
        std::string text;
        text.reserve(size_);
        for (const std::string& line : lines_) {
            text += line;
        }
        return text;
    }

private:
    mutable Mutex mutex_;
    std::deque<std::string> lines_ TAMBLO_GUARDED_BY(mutex_);
    std::size_t size_ TAMBLO_GUARDED_BY(mutex_) = 0;
};

} // namespace tamblo
