#include "os/ReplaceFile.h"

#include "os/FileDescriptor.h"
#include "os/FileOperations.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tamblo {

namespace {

constexpr mode_t kPermissions = 07777;
constexpr uid_t kSameOwner = static_cast<uid_t>(-1);

/// False with the reason in `errno`.
bool takeOver(int descriptor, const std::string& replaced) {
    struct stat status {};
    if (::lstat(replaced.c_str(), &status) != 0 || !S_ISREG(status.st_mode)) {
        return true;
    }
    // Who may not give a file away may still belong to its group. The mode last, as a new owner changes it.
    if (::fchown(descriptor, status.st_uid, status.st_gid) != 0) {
        (void)!::fchown(descriptor, kSameOwner, status.st_gid);
    }
    return ::fchmod(descriptor, status.st_mode & kPermissions) == 0;
}

} // namespace

int replaceFileAtomically(const std::string& path, std::string_view content, Durability durability) {
    // No slash: a name of the working directory.
    const std::string directory = path.substr(0, path.find_last_of('/') + 1);
    std::string temporary = directory + ".tamblo-XXXXXX";
    const FileDescriptor file(::mkostemp(temporary.data(), O_CLOEXEC));
    if (!file.isOpen()) {
        return errno;
    }
    const bool isWaiting = durability == Durability::power;
    if (!takeOver(file.get(), path) || !FileOperations::system().writeAll(file.get(), content) ||
        (isWaiting && ::fsync(file.get()) != 0) || std::rename(temporary.c_str(), path.c_str()) != 0) {
        const int failure = errno;
        ::unlink(temporary.c_str());
        return failure;
    }
    if (isWaiting) {
        // The new content stands in any case.
        const FileDescriptor parent(
            ::open(directory.empty() ? "." : directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
        (void)::fsync(parent.get());
    }
    return 0;
}

} // namespace tamblo
