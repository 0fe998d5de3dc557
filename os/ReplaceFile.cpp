#include "os/ReplaceFile.h"

#include "base/Format.h"
#include "os/FileDescriptor.h"
#include "os/FileOperations.h"
#include "os/RandomNumber.h"

#include <cerrno>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tamblo {

namespace {

constexpr mode_t kPermissions = 07777;
constexpr uid_t kSameOwner = static_cast<uid_t>(-1);

/// A new file is the owner's of its directory, as far as that can be had: root writes preferences for a
/// service that runs as a user of its own.
void giveToOwnerOf(int directory, int descriptor) {
    struct stat status {};
    if (::geteuid() == 0 && ::fstat(directory, &status) == 0) {
        (void)!::fchown(descriptor, status.st_uid, status.st_gid);
    }
}

/// False with the reason in `errno`.
bool takeOver(int descriptor, int directory, const std::string& replaced, mode_t mode) {
    struct stat status {};
    if (::fstatat(directory, replaced.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0 ||
        !S_ISREG(status.st_mode)) {
        giveToOwnerOf(directory, descriptor);
        return ::fchmod(descriptor, mode) == 0;
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
    const std::size_t nameAt = path.find_last_of('/') + 1;
    const std::string directory = nameAt == 0 ? "." : path.substr(0, nameAt);
    const FileDescriptor opened(::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return opened.isOpen() ? replaceFileAtomically(opened.get(), path.substr(nameAt), content, durability)
                           : errno;
}

int replaceFileAtomically(int directory, const std::string& name, std::string_view content,
                          Durability durability, mode_t mode) {
    constexpr int kFlags = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
    const std::string temporary = formatted(".tamblo-{}", hexadecimal(randomNumber(), 16));
    const FileDescriptor file(::openat(directory, temporary.c_str(), kFlags, S_IRUSR | S_IWUSR));
    if (!file.isOpen()) {
        return errno;
    }
    const bool isWaiting = durability == Durability::power;
    if (!takeOver(file.get(), directory, name, mode) ||
        !FileOperations::system().writeAll(file.get(), content) || (isWaiting && ::fsync(file.get()) != 0) ||
        ::renameat(directory, temporary.c_str(), directory, name.c_str()) != 0) {
        const int failure = errno;
        ::unlinkat(directory, temporary.c_str(), 0);
        return failure;
    }
    if (isWaiting) {
        // The new content stands in any case.
        (void)::fsync(directory);
    }
    return 0;
}

} // namespace tamblo
