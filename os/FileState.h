#pragma once

#include <chrono>
#include <cstdint>
#include <ctime>

#include <sys/stat.h>

namespace tamblo {

/// What tells a file's content apart from another's without reading it: which file it is, its size and its
/// times.
///
/// The kernel's times advance in ticks, so that a file that is written twice within one tick looks the same;
/// only a state that was old when the content was read stands for that content for certain. A content that
/// is changed through a shared mapping is not told.
struct FileState {
    /// A change time older than this does not come again: ticks of the kernel's clock are 10 ms at most.
    static constexpr std::chrono::milliseconds kCertainAge{20};

    std::uint64_t device = 0;
    std::uint64_t inode = 0;
    std::int64_t size = 0;
    std::int64_t modifiedSeconds = 0;
    std::int64_t modifiedNanoseconds = 0;
    std::int64_t changedSeconds = 0; ///< of the change time, which nobody can set
    std::int64_t changedNanoseconds = 0;

    bool operator==(const FileState&) const = default;

    [[nodiscard]] static FileState of(const struct stat& status) noexcept {
        return {.device = status.st_dev,
                .inode = status.st_ino,
                .size = status.st_size,
                .modifiedSeconds = status.st_mtim.tv_sec,
                .modifiedNanoseconds = status.st_mtim.tv_nsec,
                .changedSeconds = status.st_ctim.tv_sec,
                .changedNanoseconds = status.st_ctim.tv_nsec};
    }
    /// Whether a change from now on will have another state.
    [[nodiscard]] bool isOld() const noexcept {
        timespec now{};
        ::clock_gettime(CLOCK_REALTIME_COARSE, &now); // the clock of the change times
        const std::int64_t seconds = now.tv_sec - changedSeconds;
        if (seconds < 0 || seconds > 1) {
            return seconds > 0;
        }
        return std::chrono::seconds(seconds) + std::chrono::nanoseconds(now.tv_nsec - changedNanoseconds) >=
               kCertainAge;
    }
};

} // namespace tamblo
