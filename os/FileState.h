#pragma once

#include <cstdint>

#include <sys/stat.h>

namespace tamblo {

/// What tells a file's content apart from another's without reading it: which file it is, its size and its
/// times.
///
/// The kernel's times advance in ticks, so that a file that is written twice within one tick looks the same;
/// only a state that was old when the content was read stands for that content for certain. A content that
/// is changed through a shared mapping is not told.
struct FileState {
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
};

} // namespace tamblo
