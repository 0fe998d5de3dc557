#pragma once

#include <chrono>
#include <cstddef>
#include <cstdio>
#include <string_view>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tamblo {

/// The system calls behind files that are written, as they are: -1 and `errno` on failure. Names are those of
/// entries of an open directory; a link is looked at, renamed or removed itself. A test derives from this
/// class and makes single ones fail.
class FileOperations {
public:
    virtual ~FileOperations() = default;
    virtual int open(int directory, const char* name, int flags, mode_t mode) noexcept {
        return ::openat(directory, name, flags, mode);
    }
    virtual int close(int descriptor) noexcept { return ::close(descriptor); }
    virtual ssize_t write(int descriptor, const void* bytes, std::size_t count) noexcept {
        return ::write(descriptor, bytes, count);
    }
    virtual ssize_t readAt(int descriptor, void* bytes, std::size_t count, off_t offset) noexcept {
        return ::pread(descriptor, bytes, count, offset);
    }
    virtual int truncate(int descriptor, off_t size) noexcept { return ::ftruncate(descriptor, size); }
    virtual int status(int descriptor, struct stat& status) noexcept { return ::fstat(descriptor, &status); }
    virtual int status(int directory, const char* name, struct stat& status) noexcept {
        return ::fstatat(directory, name, &status, AT_SYMLINK_NOFOLLOW);
    }
    virtual int rename(int directory, const char* from, const char* to) noexcept {
        return ::renameat(directory, from, directory, to);
    }
    virtual int remove(int directory, const char* name) noexcept { return ::unlinkat(directory, name, 0); }
    /// A clock that is cheap to read and advances every few milliseconds.
    virtual std::chrono::nanoseconds coarseTime() noexcept;

    /// Writes again until all is written; what is written is taken off the front. False, with the reason in
    /// `errno`, when a write fails or gets nowhere (`ENOSPC`).
    [[nodiscard]] bool writeAll(int descriptor, std::string_view& text) noexcept;

    /// The system calls themselves.
    static FileOperations& system() noexcept;
};

} // namespace tamblo
