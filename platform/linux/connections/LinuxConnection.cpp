#include "platform/linux/connections/LinuxConnection.h"

#include "base/Format.h"
#include "platform/linux/connections/RequestDispatch.h"
#include "wire/FrameSplitter.h"
#include "wire/Reply.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <system_error>
#include <utility>

#include <sys/epoll.h>
#include <sys/socket.h>

namespace tamblo {

namespace {

/// Buffers above this are given back once they are empty.
constexpr std::size_t kKeptCapacity = 64 * 1024;

void giveBackIfLarge(TextBuffer& buffer) noexcept {
    buffer.clear();
    if (buffer.capacity() > kKeptCapacity) {
        buffer.reset();
    }
}

} // namespace

LinuxConnection::LinuxConnection(Shared& shared, FileDescriptor socket, pid_t peer, Ended ended)
    : shared_(shared), peer_(peer), ended_(std::move(ended)), socket_(std::move(socket)) {}

void LinuxConnection::resume() {
    const MutexLock lock(mutex_);
    wantsInput_ = true;
    watch();
}

std::string LinuxConnection::description() const {
    return "<connection from pid " + std::to_string(peer_) + ">";
}

void LinuxConnection::ready(std::uint32_t events) {
    int socket = -1;
    {
        const MutexLock lock(mutex_);
        if ((events & EPOLLOUT) != 0) {
            send();
        }
        // Another source of this wake-up, a signal, may have ended the reading.
        if (wantsInput_ && (events & ~static_cast<std::uint32_t>(EPOLLOUT)) != 0) {
            socket = socket_.get();
        }
    }
    if (socket < 0) {
        return;
    }
    std::span<const std::uint8_t> received;
    const Ending ending = receive(socket, received);
    if (ending != Ending::none) {
        beginEnd(ending);
    } else if (!received.empty()) {
        takeFrames(received);
    }
}

LinuxConnection::Ending LinuxConnection::receive(int socket, std::span<const std::uint8_t>& received) {
    // A long frame grows in its own buffer; otherwise what is left of the last read goes before the new
    // bytes.
    const bool collects = unfinished_.size() > kSmallRest;
    std::uint8_t* const start =
        collects ? reinterpret_cast<std::uint8_t*>(unfinished_.room(kBytesPerRead)) - unfinished_.size()
                 : shared_.intake.buffer();
    if (!collects && !unfinished_.empty()) {
        std::memcpy(start, unfinished_.data(), unfinished_.size());
    }
    const std::size_t kept = unfinished_.size();
    const std::size_t room = collects ? std::min(unfinishedWants_ - kept, kBytesPerRead) : kBytesPerRead;
    const ssize_t count = ::recv(socket, start + kept, room, MSG_DONTWAIT);
    if (count == 0) {
        return Ending::orderly;
    }
    if (count < 0) {
        const bool isQuiet = errno == EAGAIN || errno == EINTR;
        return isQuiet ? Ending::none : Ending::interrupted;
    }
    if (!collects) {
        received = {start, kept + static_cast<std::size_t>(count)};
        return Ending::none;
    }
    unfinished_.commit(static_cast<std::size_t>(count));
    if (unfinished_.size() == unfinishedWants_) {
        received = unfinished_.bytes();
    }
    return Ending::none;
}

void LinuxConnection::takeFrames(std::span<const std::uint8_t> received) {
    wire::FrameSplitter frames(received);
    std::size_t requests = 0;
    for (auto item = frames.next(); item && ending_ == Ending::none; item = frames.next()) {
        decodeAndDispatch(*item);
        ++requests;
    }
    if (ending_ == Ending::none && frames.tooLong()) {
        refuse({.endsConnection = true,
                .error = {std::string(wire::kProtocolErrorDomain), wire::kNotARequest,
                          "a frame is longer than 1 MiB"}});
    }
    const std::size_t bytes = received.size() - frames.rest().size();
    keepRest(frames.rest(), frames.wanted());
    if (requests == 0) {
        return;
    }
    const std::size_t allRequests = waitingRequests_.fetch_add(requests) + requests;
    const std::size_t allBytes = waitingBytes_.fetch_add(bytes) + bytes;
    if (allRequests > kMaximumWaitingRequests || allBytes > kMaximumWaitingBytes) {
        const MutexLock lock(mutex_);
        isFlooded_ = true;
        watch();
    }
    shared_.intake.endRead(
        requests, [self = shared_from_this(), requests, bytes] { self->carriedOut(requests, bytes); });
}

void LinuxConnection::keepRest(std::span<const std::uint8_t> rest, std::size_t wanted) {
    giveBackIfLarge(unfinished_);
    if (ending_ == Ending::none) {
        unfinished_.append({reinterpret_cast<const char*>(rest.data()), rest.size()});
    }
    unfinishedWants_ = wanted;
}

void LinuxConnection::decodeAndDispatch(std::span<const std::uint8_t> item) {
    if (const auto refusal = shared_.intake.decode(item)) {
        refuse(*refusal);
    } else {
        dispatchRequest(*exportedObject_, shared_.intake.request(), shared_from_this());
    }
}

void LinuxConnection::refuse(const wire::Refusal& refusal) {
    {
        const MutexLock lock(mutex_);
        wire::appendErrorReply(outgoing_, refusal.id, refusal.error);
        send();
    }
    if (refusal.endsConnection) {
        beginEnd(Ending::interrupted);
    }
}

void LinuxConnection::replied() {
    if (!std::exchange(hasHeldReplies_, true)) {
        shared_.heldReplies.add(shared_from_this());
    }
    if (held_.size() > kMaximumWaitingReplies) {
        giveUp();
    }
}

void LinuxConnection::carriedOut(std::size_t requests, std::size_t bytes) {
    const std::size_t requestsLeft = waitingRequests_.fetch_sub(requests) - requests;
    const std::size_t bytesLeft = waitingBytes_.fetch_sub(bytes) - bytes;
    const MutexLock lock(mutex_);
    if (isFlooded_ && requestsLeft <= kMaximumWaitingRequests && bytesLeft <= kMaximumWaitingBytes) {
        isFlooded_ = false;
        watch();
    }
}

void LinuxConnection::releaseReplies() {
    const MutexLock lock(mutex_);
    hasHeldReplies_ = false;
    if (outgoing_.empty()) {
        std::swap(outgoing_, held_);
    } else {
        outgoing_.append(held_.view());
        giveBackIfLarge(held_);
    }
    send();
}

void LinuxConnection::send() {
    if (!socket_.isOpen() || isUnwritable_) {
        outgoing_.clear();
        sent_ = 0;
        return;
    }
    while (sent_ != outgoing_.size()) {
        const ssize_t count = ::send(socket_.get(), outgoing_.data() + sent_, outgoing_.size() - sent_,
                                     MSG_DONTWAIT | MSG_NOSIGNAL);
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count < 0) {
            // A peer that is gone is found by reading; what it sent before is carried out all the same.
            isUnwritable_ = errno != EAGAIN && errno != EWOULDBLOCK;
            break;
        }
        sent_ += static_cast<std::size_t>(count);
    }
    if (sent_ == outgoing_.size() || isUnwritable_) {
        giveBackIfLarge(outgoing_);
        sent_ = 0;
    } else if (outgoing_.size() - sent_ > kMaximumWaitingReplies) {
        giveUp();
    } else if (sent_ > kKeptCapacity) {
        outgoing_.dropFront(sent_);
        sent_ = 0;
    }
    watch();
}

/// Keeps nothing more for the client, and ends the connection.
void LinuxConnection::giveUp() {
    isUnwritable_ = true;
    held_.reset();
    shared_.loop.post([self = shared_from_this()] { self->beginEnd(Ending::interrupted); });
}

void LinuxConnection::watch() {
    if (!socket_.isOpen()) {
        return;
    }
    std::uint32_t events = wantsInput_ && !isFlooded_ ? static_cast<std::uint32_t>(EPOLLIN) : 0U;
    if (!outgoing_.empty() && !isUnwritable_) {
        events |= EPOLLOUT;
    }
    if (events == watched_) {
        return;
    }
    // A socket from which nothing is wanted leaves the loop: a hang-up would be reported over and over.
    if (events == 0) {
        shared_.loop.remove(socket_.get());
    } else if (watched_ != 0) {
        shared_.loop.modify(socket_.get(), events, *this);
    } else if (!shared_.loop.add(socket_.get(), events, *this)) {
        shared_.log.report(
            LogLevel::error, "zrrs",
            formatted("a client is turned away, since its socket cannot be watched: {}. pid={}",
                      std::generic_category().message(errno), peer_));
        wantsInput_ = false;
        giveUp();
        return;
    }
    watched_ = events;
}

void LinuxConnection::stopReading() {
    const MutexLock lock(mutex_);
    wantsInput_ = false;
    watch();
}

void LinuxConnection::beginEnd(Ending ending) {
    if (ending_ != Ending::none) {
        return;
    }
    ending_ = ending;
    stopReading();
    // What was read before is carried out, and answered, first. Replies go at the end of a batch, so the end
    // of the connection waits for the batch after the one that carries out the last request.
    SerialQueue& queue = shared_.intake.queue();
    queue.post([&queue, self = shared_from_this()]() mutable {
        queue.post([self = std::move(self)] { self->shared_.loop.post([self] { self->end(); }); });
    });
}

void LinuxConnection::end() {
    if (ending_ == Ending::interrupted && interruptionHandler_) {
        interruptionHandler_();
    }
    if (invalidationHandler_) {
        invalidationHandler_();
    }
    // The handlers hold the client, the client its sessions, and those may hold replies of this connection.
    interruptionHandler_.reset();
    invalidationHandler_.reset();
    exportedObject_.reset();
    {
        const MutexLock lock(mutex_);
        wantsInput_ = false;
        isUnwritable_ = true;
        outgoing_.reset();
        held_.reset();
        watch();
        socket_.reset();
    }
    ended_(shared_from_this());
}

} // namespace tamblo
