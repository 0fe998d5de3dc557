#pragma once

#include "os/FileDescriptor.h"

#include <functional>
#include <optional>
#include <string>
#include <string_view>

struct inotify_event;

namespace tamblo {

/// Notices files of one directory whose writing has finished and, for who wants that, files that went away.
///
/// One descriptor for an event loop: when it is readable, `read` takes in what happened. The directory may be
/// missing at first, vanish, or be replaced: then its nearest existing parent is watched until it is there
/// again. Owned by whoever wants to know; `read` is called by one thread at a time. Without activity it costs
/// nothing.
class DirectoryWatcher {
public:
    /// Called with the name of a file that was written or replaced (or removed, created or used, where
    /// that is watched), or with nothing when any file may have been: the directory has come or gone, or more
    /// happened than the kernel could remember.
    using Handler = std::function<void(std::optional<std::string_view> fileName)>;

    /// `creationsAndRemovals` is for what is never written, such as sockets; `use` adds that a file is opened
    /// and closed, as for devices.
    enum class Watch { writes, writesAndRemovals, creationsAndRemovals, use };

    explicit DirectoryWatcher(std::string directory, Watch watched = Watch::writesAndRemovals);
    DirectoryWatcher(const DirectoryWatcher&) = delete;
    DirectoryWatcher& operator=(const DirectoryWatcher&) = delete;

    /// Readable, level-triggered, when `read` has something to do; -1 when nothing can be watched.
    [[nodiscard]] int fileDescriptor() const noexcept { return inotify_.get(); }
    /// Hands over everything that has happened up to now, in order, without waiting.
    void read(const Handler& handler);
    /// What keeps the directory, or the return of a missing one, from being watched, with its path; or empty.
    [[nodiscard]] std::string fault() const;
    [[nodiscard]] const std::string& directory() const noexcept { return directory_; }

private:
    void watch();
    [[nodiscard]] int watchNearestParent();
    void replaceWatch(int& current, int next) noexcept;
    /// False when the place that is watched has changed, so that the watches must be set anew.
    [[nodiscard]] bool take(const inotify_event& event, const Handler& handler);

    const std::string directory_;
    const Watch watched_;
    FileDescriptor inotify_;
    int directoryWatch_ = -1;
    int parentWatch_ = -1;
    /// The entry below the watched parent that leads to the directory.
    std::string awaitedName_;
    int error_ = 0;
};

} // namespace tamblo
