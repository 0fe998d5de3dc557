#include "os/FileOperations.h"

#include <cerrno>
#include <ctime>

namespace tamblo {

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
