// What a connection sends, and what it does about a peer that does not read.

#include "base/WhileAlive.h"
#include "platform/linux/connections/LinuxConnection.h"

#include <cerrno>
#include <utility>
#include <vector>

#include <linux/sockios.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

namespace tamblo {

namespace {

// Parts of the limit of what a connection's socket may refuse (`reply_bytes`, 4 MiB by default).
/// A piece of the server queue ends once a client has more replies to get than this: 256 KiB.
constexpr std::size_t kPartOfPiece = 16;
/// A client's requests wait while its socket has refused more than this: 1 MiB.
constexpr std::size_t kUnreadPart = 4;
/// The same once the sockets of the user have refused half of the user's limit together: 64 KiB.
constexpr std::size_t kUnreadPartOfMany = 64;

} // namespace

void LinuxConnection::replied() {
    if (!std::exchange(hasHeldReplies_, true)) {
        shared_.heldReplies.add(shared_from_this());
    }
    if (held_.size() > shared_.limits.replyBytes / kPartOfPiece) {
        // They go before there are more; a client that reads them does not pay for having asked for much.
        shared_.turns->endPiece();
    }
}

void LinuxConnection::releaseReplies() {
    const MutexLock lock(mutex_);
    hasHeldReplies_ = false;
    if (outgoing_.empty()) {
        std::swap(outgoing_, held_);
    } else {
        outgoing_.append(held_.view());
        held_.clearAndKeep(kKeptCapacity);
    }
    send();
}

void LinuxConnection::send() {
    if (!socket_.isOpen()) {
        isUnwritable_ = true;
    }
    while (!isUnwritable_ && unsent() != 0) {
        const ssize_t count =
            ::send(socket_.get(), outgoing_.data() + sent_, unsent(), MSG_DONTWAIT | MSG_NOSIGNAL);
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count < 0) {
            // A peer that is gone is found by reading; what it sent before is carried out all the same.
            isUnwritable_ = errno != EAGAIN && errno != EWOULDBLOCK;
            break;
        }
        sent_ += static_cast<std::size_t>(count);
        taken_ += static_cast<std::uint64_t>(count);
    }
    if (unsent() == 0 || isUnwritable_) {
        outgoing_.clearAndKeep(kKeptCapacity);
        sent_ = 0;
        isPatienceOver_ = false;
    } else if (sent_ > kKeptCapacity) {
        outgoing_.dropFront(sent_);
        sent_ = 0;
    }
    countUnsent();
    watch();
    if (outgoing_.empty() && std::exchange(isWaitingForPeer_, false)) {
        shared_.loop.post([self = shared_from_this()] { self->end(); });
    }
}

/// Counts what the socket has refused towards the user's, and does what its growth asks for.
void LinuxConnection::countUnsent() {
    const Limits& limits = shared_.limits;
    const std::size_t mine = unsent();
    const std::size_t all = user_->refusedBytes += mine - std::exchange(unsentCounted_, mine);
    const bool isMuchForUser = all > limits.replyBytesOfUser / 2;
    if (mine > limits.replyBytes) {
        noteLimit(limitReached("reply_bytes", limits.replyBytes).message);
        giveUp();
    } else if (mine != 0 && all > limits.replyBytesOfUser) {
        if (isPatienceOver_ || all > 2 * limits.replyBytesOfUser) {
            noteLimit(limitReached("reply_bytes_of_user", limits.replyBytesOfUser).message);
            giveUp();
        } else {
            endSilentOfUser();
            holdRequests();
        }
    } else if (mine > limits.replyBytes / (isMuchForUser ? kUnreadPartOfMany : kUnreadPart)) {
        holdRequests();
    } else if (mine <= limits.replyBytes / kUnreadPart / 2) {
        letRequestsGo();
    }
}

void LinuxConnection::holdRequests() {
    if (!isPatienceOver_ && !std::exchange(areRequestsHeld_, true)) {
        requests_->suspend();
        shared_.loop.post([self = shared_from_this()] { self->awaitPeerReads(); });
    }
}

void LinuxConnection::letRequestsGo() {
    if (std::exchange(areRequestsHeld_, false)) {
        requests_->resume();
    }
}

/// What the peer has read, but for a constant: the socket takes more only once most of what it holds is read.
std::int64_t LinuxConnection::readByPeer() const {
    int unread = 0;
    (void)::ioctl(socket_.get(), SIOCOUTQ, &unread);
    return static_cast<std::int64_t>(taken_) - unread;
}

void LinuxConnection::awaitPeerReads() {
    const MutexLock lock(mutex_);
    shared_.loop.callAfter(kPatienceWithPeer, [self = shared_from_this(), read = readByPeer()] {
        self->lookWhetherPeerReads(read);
    });
}

void LinuxConnection::lookWhetherPeerReads(std::int64_t readBefore) {
    {
        const MutexLock lock(mutex_);
        if (!areRequestsHeld_) {
            return;
        }
        if (readByPeer() == readBefore) {
            isPatienceOver_ = true;
            noteSilent();
            letRequestsGo();
            // There may be nothing more to carry out, and so nobody else who would look at the user's limit.
            countUnsent();
            return;
        }
    }
    awaitPeerReads();
}

void LinuxConnection::noteSilent() {
    const MutexLock lock(user_->mutex);
    auto& silent = user_->silent;
    if (silent.size() > 2 * user_->connections) {
        std::erase_if(silent, [](const auto& connection) { return connection.expired(); });
    }
    if (!std::exchange(isNotedSilent_, true)) {
        silent.push_back(weak_from_this());
    }
}

/// Those of the user's connections that keep replies from the others.
void LinuxConnection::endSilentOfUser() {
    std::vector<std::weak_ptr<LinuxConnection>> silent;
    {
        const MutexLock lock(user_->mutex);
        silent.swap(user_->silent);
    }
    for (const std::weak_ptr<LinuxConnection>& connection : silent) {
        shared_.loop.post(whileAlive(connection, [](LinuxConnection& other) { other.endIfSilent(); }));
    }
}

void LinuxConnection::endIfSilent() {
    const MutexLock lock(mutex_);
    isNotedSilent_ = false;
    if (isPatienceOver_ && unsent() != 0 && !isUnwritable_) {
        noteLimit(limitReached("reply_bytes_of_user", shared_.limits.replyBytesOfUser).message);
        giveUp();
    }
}

/// Keeps nothing more for the client, and ends the connection.
void LinuxConnection::giveUp() {
    isUnwritable_ = true;
    held_.reset();
    letRequestsGo();
    shared_.loop.post([self = shared_from_this()] { self->beginEnd(Ending::interrupted); });
}

} // namespace tamblo
