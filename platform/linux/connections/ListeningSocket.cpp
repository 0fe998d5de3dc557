#include "platform/linux/connections/ListeningSocket.h"

#include "base/NumberText.h"
#include "os/Directory.h"
#include "os/LocalAddress.h"

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <utility>

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

namespace tamblo {

namespace {

/// The socket for clients, and that of the status.
constexpr long kMostPassedOn = 2;
/// Waiting connections beyond this are turned away by the kernel.
constexpr int kBacklog = 1024;
/// Another start is done within milliseconds: who has the runtime directory locked for longer is not waited
/// for.
constexpr std::chrono::milliseconds kLockPatience{1000};

std::string because(const std::string& what, int error) {
    return what + ": " + std::strerror(error);
}

std::optional<long> environmentNumber(const char* name) {
    const char* const text = std::getenv(name);
    return text != nullptr ? parseNumber<long>(text) : std::nullopt;
}

bool hasOption(int socket, int option, int wanted) {
    int value = 0;
    socklen_t length = sizeof value;
    return ::getsockopt(socket, SOL_SOCKET, option, &value, &length) == 0 && value == wanted;
}

/// Whether somebody answers on the socket at this address.
bool isAnswered(const LocalAddress& address) {
    const FileDescriptor probe(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    return ::connect(probe.get(), address.get(), address.size()) == 0 || errno == EAGAIN;
}

} // namespace

int ListeningSocket::passedOn() {
    const auto count = environmentNumber("LISTEN_FDS");
    const bool isMeant = environmentNumber("LISTEN_PID") == ::getpid();
    return isMeant && count && *count >= 1 && *count <= kMostPassedOn ? static_cast<int>(*count) : 0;
}

void ListeningSocket::forgetPassedOn() {
    ::unsetenv("LISTEN_PID");
    ::unsetenv("LISTEN_FDS");
    ::unsetenv("LISTEN_FDNAMES");
}

std::optional<std::string> ListeningSocket::adopt(int descriptor) {
    // Whatever else has that number may be a descriptor of our own by now.
    if (!hasOption(descriptor, SO_DOMAIN, AF_UNIX) || !hasOption(descriptor, SO_TYPE, SOCK_STREAM) ||
        !hasOption(descriptor, SO_ACCEPTCONN, 1)) {
        return "LISTEN_FDS is set, but file descriptor " + std::to_string(descriptor) +
               " is no listening local stream socket: pass one, or unset LISTEN_FDS";
    }
    socket_ = FileDescriptor(descriptor);
    ::fcntl(descriptor, F_SETFD, FD_CLOEXEC);
    ::fcntl(descriptor, F_SETFL, ::fcntl(descriptor, F_GETFL) | O_NONBLOCK);
    return std::nullopt;
}

std::optional<std::string> ListeningSocket::bind(const std::string& path, IfAnswered ifAnswered) {
    const auto address = LocalAddress::of(path);
    if (!address) {
        return "the socket's path is too long for the system (" + path +
               "): set RUNTIME_DIRECTORY to a shorter one";
    }
    // Two services that start at the same time must not both take a left-over socket for theirs to replace.
    const std::string directory = path.substr(0, path.rfind('/'));
    const FileDescriptor lock = lockDirectory(directory, kLockPatience);
    if (!lock.isOpen() && errno == EWOULDBLOCK) {
        return "another program has " + directory + " locked: end it, or set RUNTIME_DIRECTORY";
    }

    FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (::bind(socket.get(), address->get(), address->size()) != 0) {
        if (errno != EADDRINUSE) {
            return because("cannot make the socket " + path, errno);
        }
        struct stat there {};
        if (::lstat(path.c_str(), &there) == 0 && !S_ISSOCK(there.st_mode)) {
            return path + " is in the way and no socket: remove it, or set RUNTIME_DIRECTORY";
        }
        if (ifAnswered == IfAnswered::fail && isAnswered(*address)) {
            return "another tamblod already answers at " + path + ": stop it first, or set RUNTIME_DIRECTORY";
        }
        if (::unlink(path.c_str()) != 0 || ::bind(socket.get(), address->get(), address->size()) != 0) {
            return because("cannot replace the left-over socket " + path, errno);
        }
    }
    if (::listen(socket.get(), kBacklog) != 0) {
        return because("cannot listen on " + path, errno);
    }
    ::chmod(path.c_str(), 0666);
    ::stat(path.c_str(), &file_);
    path_ = path;
    socket_ = std::move(socket);
    return std::nullopt;
}

void ListeningSocket::removeFile() {
    struct stat now {};
    if (!path_.empty() && ::stat(path_.c_str(), &now) == 0 && now.st_ino == file_.st_ino &&
        now.st_dev == file_.st_dev) {
        ::unlink(path_.c_str());
    }
    path_.clear();
}

} // namespace tamblo
