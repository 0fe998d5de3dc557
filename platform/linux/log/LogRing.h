#pragma once

#include <cstddef>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>

namespace tamblo {

/// The last lines of the log, for those who want to know what led to something.
///
/// Kept on every build, as the log is there before it is known which; what it costs is a copy of a line that
/// was formatted anyway, and memory for no more than was logged: a service at its usual level, which writes a
/// handful of lines, holds some kilobytes. Bounded in lines and in bytes; the oldest go first. Any
/// thread; the lock is held for a copy.
class LogRing {
public:
    static constexpr std::size_t kMaximumLines = 1000;
    /// A thousand lines of a usual length several times over: at the level debug they carry whole payloads.
    static constexpr std::size_t kMaximumBytes = 1U << 20U;

    /// One line, with its line end and no other in it. It is left out when there is no memory for it.
    void add(std::string_view line) noexcept;
    /// The lines, oldest first.
    [[nodiscard]] std::string text() const;

private:
    // With the lock held.
    [[nodiscard]] bool makeRoom(std::size_t length) noexcept;
    [[nodiscard]] bool grow(std::size_t length) noexcept;
    void dropOldest() noexcept;
    void copyTo(char* out) const noexcept;

    mutable std::mutex mutex_; ///< guards what follows
    /// Used in a circle: the oldest line begins at `first_`.
    std::unique_ptr<char[]> bytes_;
    std::size_t capacity_ = 0;
    std::size_t first_ = 0;
    std::size_t size_ = 0;
    std::size_t lines_ = 0;
};

} // namespace tamblo
