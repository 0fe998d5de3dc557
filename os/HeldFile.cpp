#include "os/HeldFile.h"

#include "os/SmallFile.h"

#include <cerrno>
#include <cstdio>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tamblo {

namespace {

/// A file may be replaced while it is looked at; not again and again.
constexpr int kMostAttempts = 8;

bool isStillThere(int descriptor, const std::string& path) noexcept {
    struct stat opened {};
    struct stat there {};
    return ::fstat(descriptor, &opened) == 0 && ::stat(path.c_str(), &there) == 0 &&
           opened.st_ino == there.st_ino && opened.st_dev == there.st_dev;
}

bool writeAll(int descriptor, std::string_view content) noexcept {
    while (!content.empty()) {
        const ssize_t written = ::write(descriptor, content.data(), content.size());
        if (written < 0 && errno != EINTR) {
            return false;
        }
        content.remove_prefix(written < 0 ? 0 : static_cast<std::size_t>(written));
    }
    return true;
}

} // namespace

int HeldFile::write(std::string_view content) {
    const std::string next = path_ + ".next";
    ::unlink(next.c_str());
    FileDescriptor file(
        ::open(next.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, S_IRUSR | S_IWUSR));
    if (!file.isOpen() || ::flock(file.get(), LOCK_EX | LOCK_NB) != 0 || !writeAll(file.get(), content) ||
        std::rename(next.c_str(), path_.c_str()) != 0) {
        const int error = errno;
        if (file.isOpen()) {
            ::unlink(next.c_str());
        }
        return error;
    }
    held_ = std::move(file);
    return 0;
}

void HeldFile::remove() noexcept {
    if (held_.isOpen()) {
        if (isStillThere(held_.get(), path_)) {
            ::unlink(path_.c_str());
        }
        held_.reset();
    }
}

std::optional<std::string> HeldFile::read(const std::string& path, std::size_t limit) {
    for (int attempt = 0; attempt < kMostAttempts; ++attempt) {
        const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
        struct stat state {};
        if (!file.isOpen() || ::fstat(file.get(), &state) != 0 || !S_ISREG(state.st_mode)) {
            return std::nullopt;
        }
        const bool isHeld = ::flock(file.get(), LOCK_SH | LOCK_NB) != 0 && errno == EWOULDBLOCK;
        if (isHeld) {
            SmallFile content = SmallFile::read(file.get(), limit);
            return content.error == 0 ? std::optional(std::move(content.text)) : std::nullopt;
        }
        if (isStillThere(file.get(), path)) {
            return std::nullopt;
        }
    }
    return std::nullopt;
}

} // namespace tamblo
