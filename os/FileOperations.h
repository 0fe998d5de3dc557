#pragma once

#include <chrono>
#include <cstddef>
#include <string_view>

#include <sys/stat.h>
#include <sys/types.h>

namespace tamblo {

/// The system calls behind files that are written, as they are: -1 and `errno` on failure. A test derives
/// from this class and makes single ones fail.
class FileOperations {
public:
    virtual ~FileOperations() = default;
    virtual int open(const char* path, int flags, mode_t mode) noexcept;
    virtual int close(int descriptor) noexcept;
    virtual ssize_t write(int descriptor, const void* bytes, std::size_t count) noexcept;
    virtual ssize_t readAt(int descriptor, void* bytes, std::size_t count, off_t offset) noexcept;
    virtual int truncate(int descriptor, off_t size) noexcept;
    virtual int status(int descriptor, struct stat& status) noexcept;
    virtual int status(const char* path, struct stat& status) noexcept;
    virtual int rename(const char* from, const char* to) noexcept;
    /// A clock that is cheap to read and advances every few milliseconds.
    virtual std::chrono::nanoseconds coarseTime() noexcept;

    /// Writes again until all is written; what is written is taken off the front. False, with the reason in
    /// `errno`, when a write fails or gets nowhere (`ENOSPC`).
    [[nodiscard]] bool writeAll(int descriptor, std::string_view& text) noexcept;

    /// The system calls themselves.
    static FileOperations& system() noexcept;
};

} // namespace tamblo
