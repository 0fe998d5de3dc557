#pragma once

#include "base/Mutex.h"
#include "os/FileDescriptor.h"
#include "os/FileOperations.h"

#include <chrono>
#include <memory>
#include <string>
#include <string_view>

#include <sys/stat.h>

namespace tamblo {

/// A directory that is opened once, so that files are made in it and not in whatever its path leads to
/// meanwhile.
///
/// The root is a path as the administrator has arranged it, links included. What lies below it is the
/// service's own: each part is made where it is missing, and none is entered through a symbolic link. The
/// path is looked at every tenth of a second: a directory that others have removed, renamed or replaced is
/// opened, or made, anew. Any thread.
class HeldDirectory {
public:
    using Ref = std::shared_ptr<const FileDescriptor>;

    /// `below` is a relative path, or empty. The operations, whose clock is used, must outlive this object.
    HeldDirectory(std::string root, std::string_view below, mode_t mode = S_IRWXU,
                  FileOperations& operations = FileOperations::system());

    /// The directory that the path leads to; another one is another reference. Null, with the reason in
    /// `errno`, when it can be neither opened nor made.
    [[nodiscard]] Ref open();
    [[nodiscard]] const std::string& path() const noexcept { return path_; }

private:
    [[nodiscard]] bool isStillInPlace() const TAMBLO_REQUIRES(mutex_);
    [[nodiscard]] FileDescriptor openAnew() const;

    const std::string root_;
    const std::string path_;
    const mode_t mode_;
    FileOperations& operations_;

    Mutex mutex_;
    Ref directory_ TAMBLO_GUARDED_BY(mutex_);
    std::chrono::nanoseconds checkedAt_ TAMBLO_GUARDED_BY(mutex_){0}; ///< on the coarse clock
};

} // namespace tamblo
