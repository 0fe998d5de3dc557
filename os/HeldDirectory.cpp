#include "os/HeldDirectory.h"

#include <algorithm>
#include <cerrno>
#include <utility>

#include <fcntl.h>

namespace tamblo {

namespace {

/// How often the path of an open directory is looked up.
constexpr std::chrono::milliseconds kPathCheckInterval{100};

/// Makes it, with its mode whatever the process's mask is, where it is missing.
FileDescriptor openOrMake(int parent, const char* name, int linkFlag, mode_t mode) {
    const int flags = O_RDONLY | O_DIRECTORY | O_CLOEXEC | linkFlag;
    FileDescriptor directory(::openat(parent, name, flags));
    if (directory.isOpen() || errno != ENOENT) {
        return directory;
    }
    const bool isMade = ::mkdirat(parent, name, mode) == 0;
    if (isMade || errno == EEXIST) {
        directory = FileDescriptor(::openat(parent, name, flags));
    }
    if (isMade && directory.isOpen()) {
        ::fchmod(directory.get(), mode);
    }
    return directory;
}

} // namespace

HeldDirectory::HeldDirectory(std::string root, std::string_view below, mode_t mode,
                             FileOperations& operations)
    : root_(std::move(root)),
      path_(below.empty() ? root_ : root_ + "/" + std::string(below)),
      mode_(mode),
      operations_(operations) {}

HeldDirectory::Ref HeldDirectory::open() {
    const MutexLock lock(mutex_);
    const std::chrono::nanoseconds now = operations_.coarseTime();
    if (directory_ != nullptr && now - checkedAt_ >= kPathCheckInterval) {
        checkedAt_ = now;
        if (!isStillInPlace()) {
            directory_.reset();
        }
    }
    if (directory_ == nullptr) {
        FileDescriptor opened = openAnew();
        if (!opened.isOpen()) {
            return nullptr;
        }
        directory_ = std::make_shared<const FileDescriptor>(std::move(opened));
        checkedAt_ = now;
    }
    return directory_;
}

bool HeldDirectory::isStillInPlace() const {
    struct stat held {};
    struct stat found {};
    return ::fstat(directory_->get(), &held) == 0 && ::stat(path_.c_str(), &found) == 0 &&
           held.st_ino == found.st_ino && held.st_dev == found.st_dev;
}

FileDescriptor HeldDirectory::openAnew() const {
    FileDescriptor directory = openOrMake(AT_FDCWD, root_.c_str(), 0, mode_);
    for (std::size_t at = root_.size() + 1; directory.isOpen() && at < path_.size();) {
        const std::size_t end = std::min(path_.find('/', at), path_.size());
        directory = openOrMake(directory.get(), path_.substr(at, end - at).c_str(), O_NOFOLLOW, mode_);
        at = end + 1;
    }
    return directory;
}

} // namespace tamblo
