#include "os/DirectoryWatcher.h"

#include "base/Format.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <system_error>
#include <utility>

#include <sys/inotify.h>

namespace tamblo {

namespace {

constexpr std::uint32_t kWritesMask =
    IN_CLOSE_WRITE | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR | IN_EXCL_UNLINK;
constexpr std::uint32_t kRemovalsMask = IN_MOVED_FROM | IN_DELETE;
constexpr std::uint32_t kParentMask =
    IN_CREATE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
/// Bounds one call in case files are written faster than they are told of; what is left keeps the descriptor
/// ready.
constexpr int kMaximumReads = 256;

std::string parentOf(const std::string& path) {
    const std::size_t slash = path.find_last_of('/');
    if (slash == std::string::npos) {
        return ".";
    }
    return slash == 0 ? "/" : path.substr(0, slash);
}

std::string lastNameOf(const std::string& path) {
    return path.substr(path.find_last_of('/') + 1);
}

} // namespace

DirectoryWatcher::DirectoryWatcher(std::string directory, Watch watched)
    : directory_(std::move(directory)),
      watched_(watched),
      inotify_(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC)) {
    if (inotify_.isOpen()) {
        watch();
    } else {
        error_ = errno;
    }
}

/// The parent comes first: whatever happens to the directory after that is told by an event, so that none is
/// missed between the two. It stays watched beside the directory, since the kernel tells of a directory's own
/// end only when nobody uses it any longer.
void DirectoryWatcher::watch() {
    replaceWatch(parentWatch_, watchNearestParent());
    const int parentError = errno;
    const bool isOfCreations = watched_ == Watch::creationsAndRemovals || watched_ == Watch::use;
    const std::uint32_t mask = kWritesMask | (watched_ == Watch::writes ? 0 : kRemovalsMask) |
                               (isOfCreations ? IN_CREATE | IN_ATTRIB : 0U) |
                               (watched_ == Watch::use ? IN_OPEN | IN_CLOSE : 0U);
    const int watch = ::inotify_add_watch(inotify_.get(), directory_.c_str(), mask);
    const bool isMissing = watch < 0 && (errno == ENOENT || errno == ENOTDIR);
    if (isMissing) {
        error_ = parentWatch_ < 0 ? parentError : 0;
    } else {
        error_ = watch < 0 ? errno : 0;
    }
    replaceWatch(directoryWatch_, watch);
}

std::string DirectoryWatcher::fault() const {
    return error_ == 0 ? "" : formatted("{}: {}", directory_, std::generic_category().message(error_));
}

int DirectoryWatcher::watchNearestParent() {
    std::string path = directory_;
    for (;;) {
        awaitedName_ = lastNameOf(path);
        path = parentOf(path);
        const int watch = ::inotify_add_watch(inotify_.get(), path.c_str(), kParentMask);
        if (watch >= 0 || path == "/" || path == ".") {
            return watch;
        }
    }
}

void DirectoryWatcher::replaceWatch(int& current, int next) noexcept {
    const int previous = std::exchange(current, next);
    if (previous >= 0 && previous != directoryWatch_ && previous != parentWatch_) {
        ::inotify_rm_watch(inotify_.get(), previous);
    }
}

void DirectoryWatcher::read(const Handler& handler) {
    alignas(inotify_event) std::array<char, 16384> buffer;
    for (int reads = 0; reads < kMaximumReads; ++reads) {
        const ssize_t count = ::read(inotify_.get(), buffer.data(), buffer.size());
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count <= 0) {
            return;
        }
        bool placeChanged = false;
        for (std::size_t at = 0; at < static_cast<std::size_t>(count);) {
            const auto& event = *reinterpret_cast<const inotify_event*>(buffer.data() + at);
            placeChanged = !take(event, handler) || placeChanged;
            at += sizeof(inotify_event) + event.len;
        }
        if (placeChanged) {
            watch();
            handler(std::nullopt);
        }
    }
}

bool DirectoryWatcher::take(const inotify_event& event, const Handler& handler) {
    if ((event.mask & IN_Q_OVERFLOW) != 0) {
        return false;
    }
    if ((event.mask & IN_IGNORED) != 0) {
        if (event.wd == directoryWatch_) {
            directoryWatch_ = -1;
            return false;
        }
        if (event.wd == parentWatch_) {
            parentWatch_ = -1;
            return false;
        }
        return true;
    }
    const std::string_view name(event.name, event.len != 0 ? ::strnlen(event.name, event.len) : 0);
    if (event.wd == parentWatch_) {
        return name != awaitedName_ && (event.mask & (IN_DELETE_SELF | IN_MOVE_SELF)) == 0;
    }
    if (event.wd != directoryWatch_) {
        return true;
    }
    if ((event.mask & (IN_DELETE_SELF | IN_MOVE_SELF | IN_UNMOUNT)) != 0) {
        return false;
    }
    if ((event.mask & IN_ISDIR) == 0 && !name.empty()) {
        handler(name);
    }
    return true;
}

} // namespace tamblo
