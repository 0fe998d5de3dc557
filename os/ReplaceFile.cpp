#include "os/ReplaceFile.h"

#include "base/Format.h"
#include "os/FileDescriptor.h"
#include "os/FileOperations.h"

#include <atomic>
#include <cerrno>
#include <cstdint>
#include <cstdio>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tamblo {

namespace {

constexpr mode_t kNewFileMode = S_IRUSR | S_IWUSR;
constexpr mode_t kPermissions = 07777;

/// Another name with every call of this process.
std::string temporaryName() {
    static std::atomic<std::uint64_t> count{0};
    return formatted(".tamblo-{}-{}", ::getpid(), count.fetch_add(1, std::memory_order_relaxed));
}

/// What stands at the path is a process's that had this one's number and is gone.
FileDescriptor createAnew(const std::string& path) {
    const int flags = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
    int descriptor = ::open(path.c_str(), flags, kNewFileMode);
    if (descriptor < 0 && errno == EEXIST && ::unlink(path.c_str()) == 0) {
        descriptor = ::open(path.c_str(), flags, kNewFileMode);
    }
    return FileDescriptor(descriptor);
}

/// False with the reason in `errno`.
bool fill(int descriptor, std::string_view content, const std::string& replaced) {
    struct stat status {};
    const bool modeIsRight = ::lstat(replaced.c_str(), &status) != 0 || !S_ISREG(status.st_mode) ||
                             ::fchmod(descriptor, status.st_mode & kPermissions) == 0;
    return modeIsRight && FileOperations::system().writeAll(descriptor, content);
}

} // namespace

int replaceFileAtomically(const std::string& path, std::string_view content) {
    // No slash: a name of the working directory.
    const std::string temporary = path.substr(0, path.find_last_of('/') + 1) + temporaryName();
    {
        const FileDescriptor file = createAnew(temporary);
        if (!file.isOpen()) {
            return errno;
        }
        if (!fill(file.get(), content, path)) {
            const int failure = errno;
            ::unlink(temporary.c_str());
            return failure;
        }
    }
    if (std::rename(temporary.c_str(), path.c_str()) != 0) {
        const int failure = errno;
        ::unlink(temporary.c_str());
        return failure;
    }
    return 0;
}

} // namespace tamblo
