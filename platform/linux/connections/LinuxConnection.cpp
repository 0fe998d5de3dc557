#include "platform/linux/connections/LinuxConnection.h"

#include "platform/linux/connections/LinuxConnectionService.h"
#include "platform/linux/connections/RequestDispatch.h"
#include "wire/FrameSplitter.h"
#include "wire/Reply.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
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

LinuxConnection::LinuxConnection(LinuxConnectionService& service, FileDescriptor socket, pid_t peer)
    : service_(service), peer_(peer), socket_(std::move(socket)) {}

void LinuxConnection::setExportedObject(std::shared_ptr<ZRReportingServiceProtocol> object) {
    exportedObject_ = std::move(object);
}

void LinuxConnection::setInterruptionHandler(UniqueFunction<void()> handler) {
    interruptionHandler_ = std::move(handler);
}

void LinuxConnection::setInvalidationHandler(UniqueFunction<void()> handler) {
    invalidationHandler_ = std::move(handler);
}

void LinuxConnection::resume() {
    const std::lock_guard lock(mutex_);
    wantsInput_ = true;
    watchLocked();
}

std::string LinuxConnection::description() const {
    return "<connection from pid " + std::to_string(peer_) + ">";
}

void LinuxConnection::ready(std::uint32_t events) {
    bool mayRead = false;
    {
        const std::lock_guard lock(mutex_);
        if ((events & EPOLLOUT) != 0) {
            sendLocked();
        }
        // Another source of this wake-up, a signal, may have ended the reading.
        mayRead = wantsInput_;
    }
    if ((events & ~static_cast<std::uint32_t>(EPOLLOUT)) != 0 && mayRead) {
        read();
    }
}

void LinuxConnection::read() {
    std::span<const std::uint8_t> received;
    const Ending ending = receive(received);
    if (ending != Ending::none) {
        beginEnd(ending);
        return;
    }
    takeFrames(received);
}

LinuxConnection::Ending LinuxConnection::receive(std::span<const std::uint8_t>& received) {
    // A long frame grows in its own buffer; otherwise what is left of the last read goes before the new
    // bytes.
    const bool collects = unfinished_.size() > kSmallRest;
    std::uint8_t* const start =
        collects ? reinterpret_cast<std::uint8_t*>(unfinished_.room(kBytesPerRead)) - unfinished_.size()
                 : service_.readBuffer_.get();
    if (!collects && !unfinished_.empty()) {
        std::memcpy(start, unfinished_.data(), unfinished_.size());
    }
    const std::size_t kept = unfinished_.size();
    const std::size_t room = collects ? std::min(unfinishedWants_ - kept, kBytesPerRead) : kBytesPerRead;
    const ssize_t count = ::recv(socket_.get(), start + kept, room, MSG_DONTWAIT);
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
    if (received.empty()) {
        return;
    }
    wire::FrameSplitter frames(received);
    std::size_t requests = 0;
    for (auto item = frames.next(); item && ending_ == Ending::none; item = frames.next()) {
        carryOut(*item);
        ++requests;
    }
    if (ending_ == Ending::none && frames.tooLong()) {
        refuse({.endsConnection = true,
                .error = {std::string(wire::kProtocolErrorDomain), wire::kNotARequest,
                          "a frame is longer than 1 MiB"}});
    }
    const std::size_t bytes = received.size() - frames.rest().size();
    keepRest(frames.rest(), frames.wanted());
    if (requests == 0 || service_.requests_ == nullptr) {
        return;
    }
    const std::size_t allRequests = waitingRequests_.fetch_add(requests) + requests;
    const std::size_t allBytes = waitingBytes_.fetch_add(bytes) + bytes;
    if (allRequests > kMaximumWaitingRequests || allBytes > kMaximumWaitingBytes) {
        const std::lock_guard lock(mutex_);
        isFlooded_ = true;
        watchLocked();
    }
    service_.requests_->post(
        [self = shared_from_this(), requests, bytes] { self->workedOff(requests, bytes); });
    service_.posted(requests);
}

void LinuxConnection::keepRest(std::span<const std::uint8_t> rest, std::size_t wanted) {
    giveBackIfLarge(unfinished_);
    if (ending_ == Ending::none) {
        unfinished_.append({reinterpret_cast<const char*>(rest.data()), rest.size()});
    }
    unfinishedWants_ = wanted;
}

void LinuxConnection::carryOut(std::span<const std::uint8_t> item) {
    wire::Request& request = service_.request_;
    if (const auto refusal = wire::decodeRequest(item, service_.keySets_, request)) {
        refuse(*refusal);
        return;
    }
    dispatchRequest(*exportedObject_, request, shared_from_this());
}

void LinuxConnection::refuse(const wire::Refusal& refusal) {
    {
        const std::lock_guard lock(mutex_);
        wire::appendErrorReply(outgoing_, refusal.id, refusal.error);
        sendLocked();
    }
    if (refusal.endsConnection) {
        beginEnd(Ending::interrupted);
    }
}

void LinuxConnection::replied() {
    if (!std::exchange(hasHeldReplies_, true)) {
        service_.hasReplies(shared_from_this());
    }
    if (held_.size() > kMaximumWaitingReplies) {
        giveUpLocked();
    }
}

void LinuxConnection::workedOff(std::size_t requests, std::size_t bytes) {
    const std::size_t requestsLeft = waitingRequests_.fetch_sub(requests) - requests;
    const std::size_t bytesLeft = waitingBytes_.fetch_sub(bytes) - bytes;
    const std::lock_guard lock(mutex_);
    if (isFlooded_ && requestsLeft <= kMaximumWaitingRequests && bytesLeft <= kMaximumWaitingBytes) {
        isFlooded_ = false;
        watchLocked();
    }
}

void LinuxConnection::releaseReplies() {
    const std::lock_guard lock(mutex_);
    hasHeldReplies_ = false;
    if (outgoing_.empty()) {
        std::swap(outgoing_, held_);
    } else {
        outgoing_.append(held_.view());
        giveBackIfLarge(held_);
    }
    sendLocked();
}

void LinuxConnection::sendLocked() {
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
        giveUpLocked();
    } else if (sent_ > kKeptCapacity) {
        outgoing_.dropFront(sent_);
        sent_ = 0;
    }
    watchLocked();
}

/// Keeps nothing more for a client that does not read, and ends the connection.
void LinuxConnection::giveUpLocked() {
    isUnwritable_ = true;
    held_.reset();
    service_.loop_.post([self = shared_from_this()] { self->beginEnd(Ending::interrupted); });
}

void LinuxConnection::watchLocked() {
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
        service_.loop_.remove(socket_.get());
    } else if (watched_ == 0) {
        service_.loop_.add(socket_.get(), events, *this);
    } else {
        service_.loop_.modify(socket_.get(), events, *this);
    }
    watched_ = events;
}

void LinuxConnection::stopReading() {
    const std::lock_guard lock(mutex_);
    wantsInput_ = false;
    watchLocked();
}

void LinuxConnection::beginEnd(Ending ending) {
    if (ending_ != Ending::none) {
        return;
    }
    ending_ = ending;
    stopReading();
    // What was read before is carried out, and answered, first. Replies go at the end of a batch, so the end
    // of the connection waits for the batch after the one that carries out the last request.
    auto endLater = [self = shared_from_this()] { self->service_.loop_.post([self] { self->end(); }); };
    if (service_.requests_ != nullptr) {
        service_.requests_->post([&requests = *service_.requests_, endLater] { requests.post(endLater); });
    } else {
        endLater();
    }
}

void LinuxConnection::end() {
    if (!exportedObject_) {
        return;
    }
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
        const std::lock_guard lock(mutex_);
        wantsInput_ = false;
        isUnwritable_ = true;
        outgoing_.reset();
        held_.reset();
        watchLocked();
        socket_.reset();
    }
    service_.ended(*this);
}

} // namespace tamblo
