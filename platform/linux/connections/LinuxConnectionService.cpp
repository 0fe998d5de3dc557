#include "platform/linux/connections/LinuxConnectionService.h"

#include "base/NumberText.h"
#include "os/Directory.h"
#include "os/LocalAddress.h"
#include "platform/LogOrigin.h"
#include "wire/Protocol.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <new>
#include <set>
#include <string_view>
#include <utility>

#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <unistd.h>

namespace tamblo {

namespace {

constexpr int kActivatedSocket = 3;
/// Waiting connections beyond this are turned away by the kernel.
constexpr int kBacklog = 1024;
/// Another start is done within milliseconds: who has the runtime directory locked for longer is not waited
/// for.
constexpr std::chrono::milliseconds kLockPatience{1000};
/// How long accepting rests when the process has no descriptors left.
constexpr std::chrono::milliseconds kAcceptPause{100};
/// How many connections one wake-up accepts, so that those there are get their turn.
constexpr int kAcceptsPerWakeUp = 64;
constexpr std::string_view kLogCategory = "zrrs";
/// Descriptors that no connection gets: for files that are opened while all others are taken.
constexpr std::size_t kReservedDescriptors = 32;
#ifndef SO_PEERPIDFD
constexpr int SO_PEERPIDFD = 77; ///< of Linux 6.5
#endif

std::string because(const std::string& what, int error) {
    return what + ": " + std::strerror(error);
}

bool environmentSays(const char* name, long wanted) {
    const char* const text = std::getenv(name);
    return text != nullptr && parseNumber<long>(text) == wanted;
}

bool activatedSocketHas(int option, int wanted) {
    int value = 0;
    socklen_t length = sizeof value;
    return ::getsockopt(kActivatedSocket, SOL_SOCKET, option, &value, &length) == 0 && value == wanted;
}

LinuxConnection::Peer peerOf(int socket) {
    ucred credentials{};
    socklen_t length = sizeof credentials;
    ::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &length);
    int process = -1;
    length = sizeof process;
    if (::getsockopt(socket, SOL_SOCKET, SO_PEERPIDFD, &process, &length) != 0) {
        process = -1;
    }
    return {{credentials.uid, credentials.pid}, FileDescriptor(process)};
}

std::size_t descriptorLimit() noexcept {
    rlimit limit{};
    ::getrlimit(RLIMIT_NOFILE, &limit);
    return std::max<std::size_t>(limit.rlim_cur, 2 * kReservedDescriptors);
}

/// Whether somebody answers on the socket at this address.
bool isAnswered(const LocalAddress& address) {
    const FileDescriptor probe(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    return ::connect(probe.get(), address.get(), address.size()) == 0 || errno == EAGAIN;
}

} // namespace

LinuxConnectionService::LinuxConnectionService(EventLoop& loop, const Clock& clock, StructuredLog& log,
                                               const Limits& limits)
    : shared_(loop, log, limits), clock_(clock), descriptors_(descriptorLimit()) {}

LinuxConnectionService::~LinuxConnectionService() {
    removeSocketFile();
}

std::optional<std::string> LinuxConnectionService::open(const std::string& runtimeDirectory) {
    const bool isActivated = environmentSays("LISTEN_PID", ::getpid()) && environmentSays("LISTEN_FDS", 1);
    return isActivated ? adoptActivatedSocket() : bindSocket(wire::socketPath(runtimeDirectory));
}

std::optional<std::string> LinuxConnectionService::adoptActivatedSocket() {
    // Whatever else has that number may be a descriptor of our own by now.
    if (!activatedSocketHas(SO_DOMAIN, AF_UNIX) || !activatedSocketHas(SO_TYPE, SOCK_STREAM) ||
        !activatedSocketHas(SO_ACCEPTCONN, 1)) {
        return "LISTEN_FDS is set, but file descriptor 3 is no listening local stream socket: pass one, or "
               "unset LISTEN_FDS";
    }
    ::unsetenv("LISTEN_PID");
    ::unsetenv("LISTEN_FDS");
    socket_ = FileDescriptor(kActivatedSocket);
    ::fcntl(socket_.get(), F_SETFD, FD_CLOEXEC);
    ::fcntl(socket_.get(), F_SETFL, ::fcntl(socket_.get(), F_GETFL) | O_NONBLOCK);
    return std::nullopt;
}

std::optional<std::string> LinuxConnectionService::bindSocket(const std::string& path) {
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
        if (isAnswered(*address)) {
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
    ::stat(path.c_str(), &socketFile_);
    socketPath_ = path;
    socket_ = std::move(socket);
    return std::nullopt;
}

void LinuxConnectionService::removeSocketFile() {
    struct stat now {};
    if (!socketPath_.empty() && ::stat(socketPath_.c_str(), &now) == 0 && now.st_ino == socketFile_.st_ino &&
        now.st_dev == socketFile_.st_dev) {
        ::unlink(socketPath_.c_str());
    }
    socketPath_.clear();
}

ConnectionListener& LinuxConnectionService::listenerForServiceName(std::string_view) {
    return *this;
}

void LinuxConnectionService::resume() {
    isWatched_ = shared_.loop.add(socket_.get(), EPOLLIN, *this);
    if (!isWatched_) {
        pauseAccepting(errno);
    }
}

void LinuxConnectionService::ready(std::uint32_t) {
    for (int i = 0; i < kAcceptsPerWakeUp; ++i) {
        FileDescriptor socket(::accept4(socket_.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
        if (socket.isOpen()) {
            if (std::exchange(isPaused_, false)) {
                shared_.log.report(LogLevel::error, kLogCategory, "accepting connections again");
            }
            try {
                accept(std::move(socket));
            } catch (const std::bad_alloc&) {
                shared_.log.report(LogLevel::error, kLogCategory,
                                   "a client is turned away: no memory is left");
            }
            continue;
        }
        if (errno == EMFILE || errno == ENFILE || errno == ENOBUFS || errno == ENOMEM) {
            pauseAccepting(errno);
            return;
        }
        if (errno != ECONNABORTED && errno != EINTR) {
            return;
        }
    }
}

void LinuxConnectionService::pauseAccepting(int error) {
    if (!std::exchange(isPaused_, true)) {
        shared_.log.report(LogLevel::error, kLogCategory, because("accepting connections rests", error));
    }
    stopWatching();
    shared_.loop.callAfter(kAcceptPause, [this] {
        if (socket_.isOpen()) {
            resume();
        }
    });
}

void LinuxConnectionService::stopWatching() {
    if (std::exchange(isWatched_, false)) {
        shared_.loop.remove(socket_.get());
    }
}

void LinuxConnectionService::accept(FileDescriptor socket) {
    const int descriptor = socket.get();
    LinuxConnection::Peer peer = peerOf(descriptor);
    const LogOrigin origin(peer.identity);
    const std::shared_ptr<ClientUser> user = userNumbered(peer.identity.user);
    const auto connection =
        std::make_shared<LinuxConnection>(shared_, std::move(socket), std::move(peer), user,
                                          [this, user](const auto& gone) { ended(gone, *user); });
    if (const auto reason = refusalOf(*user, descriptor)) {
        connection->turnAway(*reason);
        return;
    }
    connection->openQueue();
    {
        // Before it can be used: whoever is in the loop is held here.
        const MutexLock lock(mutex_);
        connections_.insert(connection);
    }
    if (delegate_->shouldAcceptNewConnection(*connection)) {
        ++user->connections;
    } else {
        const MutexLock lock(mutex_);
        connections_.erase(connection);
    }
}

const std::shared_ptr<ClientUser>& LinuxConnectionService::userNumbered(uid_t user) {
    std::shared_ptr<ClientUser>& found = users_[user];
    if (found == nullptr) {
        found = std::make_shared<ClientUser>(user);
    }
    return found;
}

std::optional<ReplyError> LinuxConnectionService::refusalOf(const ClientUser& user, int descriptor) const {
    // One user never takes the descriptors of all.
    const std::size_t most =
        std::min(shared_.limits.connectionsOfUser, (descriptors_ - kReservedDescriptors) / 4 * 3);
    if (user.connections >= most) {
        return limitReached("connections_of_user", most);
    }
    // The kernel gives the lowest number that is free.
    if (static_cast<std::size_t>(descriptor) + kReservedDescriptors >= descriptors_) {
        return limitReached("descriptors", descriptors_ - kReservedDescriptors);
    }
    return std::nullopt;
}

void LinuxConnectionService::ended(const std::shared_ptr<LinuxConnection>& connection, ClientUser& user) {
    user.isTurnedAway = false;
    if (--user.connections == 0) {
        users_.erase(user.user);
    }
    const MutexLock lock(mutex_);
    connections_.erase(connection);
}

std::size_t LinuxConnectionService::connectionCount() {
    const MutexLock lock(mutex_);
    return connections_.size();
}

std::vector<pid_t> LinuxConnectionService::clientProcesses() {
    std::set<pid_t> processes;
    const MutexLock lock(mutex_);
    for (const auto& connection : connections_) {
        processes.insert(connection->peerProcessIdentifier());
    }
    return {processes.begin(), processes.end()};
}

void LinuxConnectionService::stop() {
    stopWatching();
    removeSocketFile();
    socket_.reset();
    const MutexLock lock(mutex_);
    for (const auto& connection : connections_) {
        connection->stopReading();
    }
}

void LinuxConnectionService::letGo() {
    // The lists of a user hold its connections, and these the user.
    for (const auto& [number, user] : users_) {
        user->readable.clear();
        const MutexLock lock(user->mutex);
        user->heldBack.clear();
    }
    MutexLock lock(mutex_);
    const auto connections = std::exchange(connections_, {});
    lock.unlock();
}

} // namespace tamblo
