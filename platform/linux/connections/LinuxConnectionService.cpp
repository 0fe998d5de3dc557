#include "platform/linux/connections/LinuxConnectionService.h"

#include "platform/Counters.h"
#include "platform/LogOrigin.h"
#include "wire/Protocol.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
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

/// The first that the service manager passes on.
constexpr int kPassedOnSocket = 3;
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

} // namespace

LinuxConnectionService::LinuxConnectionService(EventLoop& loop, const Clock& clock, StructuredLog& log,
                                               const Limits& limits)
    : shared_(loop, log, limits), clock_(clock), descriptors_(descriptorLimit()) {}

std::optional<std::string> LinuxConnectionService::open(const std::string& runtimeDirectory) {
    return ListeningSocket::passedOn() != 0 ? socket_.adopt(kPassedOnSocket)
                                            : socket_.bind(wire::socketPath(runtimeDirectory));
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
                counters::add(counters::Counter::connectionsNoMemory);
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
    counters::add(counters::Counter::acceptingRests);
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
        counters::add(counters::Counter::connectionsTurnedAway);
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
        counters::add(counters::Counter::connectionsAccepted);
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

ConnectionUse LinuxConnectionService::use() const {
    ConnectionUse most;
    for (const auto& [number, user] : users_) {
        most.connections = std::max(most.connections, user->connections);
        most.waitingBytes = std::max(most.waitingBytes, user->waitingBytes.load());
        most.unfinishedBytes = std::max(most.unfinishedBytes, user->unfinishedBytes);
        most.replyBytes = std::max(most.replyBytes, user->refusedBytes.load());
    }
    return most;
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
    socket_.close();
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
