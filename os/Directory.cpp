#include "os/Directory.h"

#include <cerrno>
#include <memory>
#include <string_view>
#include <thread>

#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

namespace tamblo {

namespace {

constexpr std::chrono::milliseconds kLockRetry{5};
constexpr int kReadDirectory = O_RDONLY | O_DIRECTORY | O_CLOEXEC;
/// Of a directory that is removed, at a time.
constexpr std::size_t kEntriesAtATime = 1024;

int makeDirectory(const std::string& path) {
    if (::mkdir(path.c_str(), S_IRWXU) != 0) {
        // On a read-only file system the error need not say that the directory is there.
        const int failure = errno;
        struct stat status {};
        if (::stat(path.c_str(), &status) != 0) {
            return failure;
        }
        return S_ISDIR(status.st_mode) ? 0 : ENOTDIR;
    }
    const FileDescriptor made(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    return made.isOpen() && ::fchmod(made.get(), S_IRWXU) == 0 ? 0 : errno;
}

} // namespace

int makeDirectories(const std::string& path) {
    const int failure = makeDirectory(path);
    const std::size_t slash = path.find_last_of('/');
    if (failure != ENOENT || slash == std::string::npos || slash == 0) {
        return failure;
    }
    const int parentFailure = makeDirectories(path.substr(0, slash));
    return parentFailure != 0 ? parentFailure : makeDirectory(path);
}

FileDescriptor lockDirectory(const std::string& path, std::optional<std::chrono::milliseconds> patience) {
    const auto begin = std::chrono::steady_clock::now();
    FileDescriptor directory(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    while (directory.isOpen() && ::flock(directory.get(), patience ? LOCK_EX | LOCK_NB : LOCK_EX) != 0) {
        const int failure = errno;
        const bool isTaken = failure == EWOULDBLOCK && std::chrono::steady_clock::now() < begin + *patience;
        if (isTaken) {
            std::this_thread::sleep_for(kLockRetry);
        } else if (failure != EINTR) {
            directory.reset();
            errno = failure;
        }
    }
    return directory;
}

DirectoryEntries DirectoryEntries::read(const std::string& path, std::size_t most) {
    const FileDescriptor directory(::open(path.c_str(), kReadDirectory));
    return directory.isOpen() ? read(directory.get(), most) : DirectoryEntries{errno};
}

DirectoryEntries DirectoryEntries::read(int descriptor, std::size_t most) {
    // Another place to read from than the descriptor's, which its owner may read from, too.
    const int own = ::openat(descriptor, ".", kReadDirectory);
    const std::unique_ptr<DIR, int (*)(DIR*)> directory(own < 0 ? nullptr : ::fdopendir(own), ::closedir);
    if (directory == nullptr) {
        return {errno};
    }
    DirectoryEntries entries;
    while (const dirent* entry = ::readdir(directory.get())) {
        const std::string_view name = entry->d_name;
        if (name == "." || name == "..") {
            continue;
        }
        if (entries.names.size() == most) {
            entries.isCut = true;
            break;
        }
        entries.names.emplace_back(name);
    }
    return entries;
}

int removeTree(int directory, const std::string& name) {
    if (::unlinkat(directory, name.c_str(), 0) == 0 || errno == ENOENT) {
        return 0;
    }
    if (errno != EISDIR) {
        return errno;
    }
    const FileDescriptor tree(::openat(directory, name.c_str(), kReadDirectory | O_NOFOLLOW));
    if (!tree.isOpen()) {
        return errno;
    }
    for (bool isMore = true; isMore;) {
        const DirectoryEntries entries = DirectoryEntries::read(tree.get(), kEntriesAtATime);
        for (const std::string& entry : entries.names) {
            if (const int failure = removeTree(tree.get(), entry)) {
                return failure;
            }
        }
        isMore = entries.isCut;
    }
    return ::unlinkat(directory, name.c_str(), AT_REMOVEDIR) == 0 ? 0 : errno;
}

std::uint64_t sizeOfTree(int directory, const std::string& name, std::size_t& entries) {
    struct stat status {};
    if (::fstatat(directory, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
        return 0;
    }
    if (!S_ISDIR(status.st_mode)) {
        return S_ISREG(status.st_mode) ? static_cast<std::uint64_t>(status.st_size) : 0;
    }
    std::uint64_t size = 0;
    const FileDescriptor tree(::openat(directory, name.c_str(), kReadDirectory | O_NOFOLLOW));
    if (tree.isOpen()) {
        for (const std::string& entry : DirectoryEntries::read(tree.get(), entries).names) {
            if (entries != 0) {
                --entries;
                size += sizeOfTree(tree.get(), entry, entries);
            }
        }
    }
    return size;
}

} // namespace tamblo
