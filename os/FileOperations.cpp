#include "os/FileOperations.h"

#include <cerrno>
#include <cstdio>
#include <ctime>

#include <fcntl.h>
#include <unistd.h>

namespace tamblo {

int FileOperations::open(const char* path, int flags, mode_t mode) noexcept {
    return ::open(path, flags, mode);
}

int FileOperations::close(int descriptor) noexcept {
    return ::close(descriptor);
}

ssize_t FileOperations::write(int descriptor, const void* bytes, std::size_t count) noexcept {
    return ::write(descriptor, bytes, count);
}

ssize_t FileOperations::readAt(int descriptor, void* bytes, std::size_t count, off_t offset) noexcept {
    return ::pread(descriptor, bytes, count, offset);
}

int FileOperations::truncate(int descriptor, off_t size) noexcept {
    return ::ftruncate(descriptor, size);
}

int FileOperations::status(int descriptor, struct stat& status) noexcept {
    return ::fstat(descriptor, &status);
}

int FileOperations::status(const char* path, struct stat& status) noexcept {
    return ::stat(path, &status);
}

int FileOperations::rename(const char* from, const char* to) noexcept {
    return ::rename(from, to);
}

std::chrono::nanoseconds FileOperations::coarseTime() noexcept {
    timespec time{};
    ::clock_gettime(CLOCK_MONOTONIC_COARSE, &time);
    return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

bool FileOperations::writeAll(int descriptor, std::string_view& text) noexcept {
    while (!text.empty()) {
        const ssize_t count = write(descriptor, text.data(), text.size());
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count <= 0) {
            errno = count == 0 ? ENOSPC : errno;
            return false;
        }
        text.remove_prefix(static_cast<std::size_t>(count));
    }
    return true;
}

FileOperations& FileOperations::system() noexcept {
    static FileOperations operations;
    return operations;
}

} // namespace tamblo
