#pragma once

#include "os/FileOperations.h"
#include "tests/Files.h"
#include "tests/fakes/FakeDevice.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <cerrno>

#include <poll.h>

namespace tamblo {

[[nodiscard]] inline bool isReadable(int descriptor, int milliseconds = 2000) {
    pollfd question{descriptor, POLLIN, 0};
    return ::poll(&question, 1, milliseconds) == 1;
}

/// The real system calls on a disk that fills up, and with faults that tests switch on. Time passes at every
/// look.
class FaultyOperations final : public FileOperations {
public:
    std::optional<std::size_t> room; ///< bytes that can still be written
    std::size_t largestWrite = 1U << 30U;
    int interruptions = 0; ///< of writes to come, every second one
    int truncateError = 0;
    int renameError = 0; ///< of the newest file of a rotation, which is the last to be moved
    int refusedDirectories = 0;
    int writes = 0;
    std::function<void()> beforeWrite = [] {};

    int open(int directory, const char* name, int flags, mode_t mode) noexcept override {
        const bool fails = (flags & O_DIRECTORY) != 0 && refusedDirectories-- > 0;
        return fails ? fail(EMFILE) : FileOperations::open(directory, name, flags, mode);
    }
    ssize_t write(int descriptor, const void* bytes, std::size_t count) noexcept override {
        beforeWrite();
        ++writes;
        isInterrupted_ = interruptions > 0 && !isInterrupted_;
        if (isInterrupted_) {
            --interruptions;
            return fail(EINTR);
        }
        count = std::min({count, largestWrite, room.value_or(count)});
        if (room) {
            *room -= count;
        }
        return count == 0 ? fail(ENOSPC) : FileOperations::write(descriptor, bytes, count);
    }
    int truncate(int descriptor, off_t size) noexcept override {
        return truncateError != 0 ? fail(truncateError) : FileOperations::truncate(descriptor, size);
    }
    int rename(int directory, const char* from, const char* to) noexcept override {
        const bool fails = renameError != 0 && std::string_view(from).ends_with(".jsonl");
        return fails ? fail(renameError) : FileOperations::rename(directory, from, to);
    }
    std::chrono::nanoseconds coarseTime() noexcept override { return std::chrono::seconds(++time_); }

private:
    static int fail(int error) noexcept {
        errno = error;
        return -1;
    }
    bool isInterrupted_ = false;
    long time_ = 0;
};

} // namespace tamblo
