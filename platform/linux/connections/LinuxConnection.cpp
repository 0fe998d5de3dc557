#include "platform/linux/connections/LinuxConnection.h"

#include "base/Format.h"
#include "platform/Counters.h"
#include "platform/LogOrigin.h"
#include "platform/linux/connections/RequestDispatch.h"
#include "wire/FrameSplitter.h"
#include "wire/Reply.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <new>
#include <system_error>
#include <utility>

#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace tamblo {

namespace {

/// What a request takes while it waits, besides its values.
constexpr std::size_t kRequestBytes = 256;
/// A client whose requests wait for it to read is itself read no further than to this.
constexpr std::size_t kWaitingBytesOfSuspended = 64 * 1024;
/// Connections that are read on when one of the user's requests has been carried out.
constexpr int kReadOnAtOnce = 16;

ReplyError outOfMemory() {
    return {std::string(kProtocolErrorDomain), kLimitReached, "memory: the service has none left"};
}

static_assert(std::ranges::equal(counters::kMethods, wire::kMethods, {}, {}, &wire::MethodRow::name));

void countError(wire::Method method, counters::RequestError error) noexcept {
    counters::addRequestError(static_cast<std::size_t>(method), error);
}

/// What was refused where it was read. Only then is a method known when it is the method's.
void countRefusal(const wire::Refusal& refusal, wire::Method method) noexcept {
    using counters::Counter;
    const bool isMessage = method == wire::Method::sendMessage;
    const bool areParameters = refusal.error.code == wire::kWrongParameters;
    switch (refusal.error.code) {
    case wire::kNotWellFormed:
        return counters::add(Counter::requestsRefusedNotWellFormed);
    case wire::kNotARequest:
        return counters::add(Counter::requestsRefusedNotARequest);
    case wire::kUnknownMethod:
        return counters::add(Counter::requestsRefusedUnknownMethod);
    case wire::kWrongParameters:
        counters::add(Counter::requestsRefusedParameters);
        break;
    default:
        counters::add(Counter::requestsRefusedLimit);
    }
    countError(method,
               areParameters ? counters::RequestError::wrongParameters : counters::RequestError::limit);
    if (isMessage) {
        counters::addAlone(Counter::messagesReceived);
        counters::add(areParameters ? Counter::messagesRefusedFrame : Counter::messagesRefusedLimit);
    }
}

bool mayKillService(uid_t user) noexcept {
    return user == 0 || user == ::geteuid();
}

} // namespace

LinuxConnection::LinuxConnection(Shared& shared, FileDescriptor socket, Peer peer,
                                 std::shared_ptr<ClientUser> user, Ended ended)
    : shared_(shared),
      peer_(peer.identity),
      user_(std::move(user)),
      peerProcess_(std::move(peer.process)),
      ended_(std::move(ended)),
      unfinishedPlace_(shared.unfinished.none()),
      socket_(std::move(socket)) {}

void LinuxConnection::openQueue() {
    requests_ = shared_.turns->makeQueue(peer_, [connection = weak_from_this()] {
        if (const auto self = connection.lock()) {
            self->shared_.loop.post([self] { self->endBeyond(outOfMemory()); });
        }
    });
}

bool LinuxConnection::isPeerThere() const noexcept {
    // Signal 0 finds a process that has ended, too, for as long as its number is its own.
    return !peerProcess_.isOpen() ||
           ::syscall(SYS_pidfd_send_signal, peerProcess_.get(), 0, nullptr, 0) == 0 || errno == EPERM;
}

void LinuxConnection::resume() {
    peerProcess_.reset();
    const MutexLock lock(mutex_);
    wantsInput_ = true;
    watch();
}

std::string LinuxConnection::description() const {
    return "<connection from pid " + std::to_string(peer_.process) + ">";
}

void LinuxConnection::ready(std::uint32_t events) {
    bool isReadable = false;
    {
        const MutexLock lock(mutex_);
        if ((events & (EPOLLOUT | EPOLLHUP | EPOLLERR)) != 0) {
            send();
        }
        // Another source of this wake-up, a signal, may have ended the reading.
        isReadable = wantsInput_ && (events & ~static_cast<std::uint32_t>(EPOLLOUT)) != 0;
    }
    if (isReadable && !std::exchange(isReadable_, true)) {
        shared_.reading.add(shared_from_this(), user_);
    }
}

void LinuxConnection::read(RequestTally::Time now) {
    isReadable_ = false;
    const LogOrigin origin(peer_);
    requests_->tally().beginArrival(now);
    try {
        readOnce();
    } catch (const std::bad_alloc&) {
        endBeyond(outOfMemory());
    }
    requests_->tally().endArrival();
}

void LinuxConnection::readOnce() {
    if (ending_ != Ending::none || holdBackIfFlooded()) {
        return;
    }
    const std::size_t waiting = waitingRequests_;
    int socket = -1;
    {
        const MutexLock lock(mutex_);
        if (!wantsInput_) {
            return;
        }
        socket = socket_.get();
    }
    std::span<const std::uint8_t> received;
    const Ending ending = receive(socket, received);
    countUnfinished();
    if (ending != Ending::none) {
        counters::add(counters::Counter::requestsLostUnfinished, unfinished_.empty() ? 0 : 1);
        beginEnd(ending);
    } else if (!received.empty()) {
        takeFrames(received);
    }
    if (waitingRequests_ <= waiting) {
        // Nothing was read that calls others of the user when it has been carried out.
        readOnOthers();
    }
}

/// Has the loop hear nothing of the socket where too much waits, until that is carried out. Whether it does.
bool LinuxConnection::holdBackIfFlooded() {
    const Limits& limits = shared_.limits;
    const MutexLock lock(mutex_);
    bool isHeld = waitingRequests_ > limits.waitingRequests ||
                  waitingBytes_ > (areRequestsHeld_ ? kWaitingBytesOfSuspended : limits.waitingBytes);
    if (!isHeld) {
        const MutexLock userLock(user_->mutex);
        isHeld = user_->waitingBytes > limits.waitingBytesOfUser;
        if (isHeld) {
            user_->heldBack.push_back(shared_from_this());
        }
    }
    if (isHeld) {
        isFlooded_ = true;
        watch();
    }
    return isHeld;
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
    requests_->tally().addReceived(static_cast<std::uint64_t>(count));
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
    std::size_t bytes = 0;
    for (auto item = frames.next(); item && ending_ == Ending::none; item = frames.next()) {
        bytes += decodeAndDispatch(*item);
        ++requests;
    }
    if (ending_ == Ending::none && frames.tooLong()) {
        counters::add(counters::Counter::requestsRefusedNotARequest);
        refuse({.endsConnection = true,
                .error = {std::string(kProtocolErrorDomain), wire::kNotARequest,
                          "a frame is longer than 1 MiB"}});
    }
    sendRefusals();
    keepRest(frames.rest(), frames.wanted());
    countUnfinished();
    if (bytes == 0) {
        return;
    }
    waitingRequests_ += requests;
    waitingBytes_ += bytes;
    user_->waitingBytes += bytes;
    requests_->tally().endArrival();
    requests_->post([self = shared_from_this(), requests, bytes] { self->carriedOut(requests, bytes); });
    shared_.intake.endRead(requests);
}

void LinuxConnection::keepRest(std::span<const std::uint8_t> rest, std::size_t wanted) {
    unfinished_.clearAndKeep(kKeptCapacity);
    if (ending_ == Ending::none) {
        unfinished_.append({reinterpret_cast<const char*>(rest.data()), rest.size()});
    }
    unfinishedWants_ = wanted;
}

/// Counts the beginning of a frame towards the user's, and has it watched for its progress.
void LinuxConnection::countUnfinished() {
    const bool isUnfinished = ending_ == Ending::none && !unfinished_.empty();
    const std::size_t bytes = isUnfinished ? unfinished_.capacity() : 0;
    user_->unfinishedBytes += bytes - std::exchange(unfinishedCounted_, bytes);
    if (!isUnfinished) {
        shared_.unfinished.forget(unfinishedPlace_);
        return;
    }
    shared_.unfinished.note(*this, unfinishedPlace_);
    if (user_->unfinishedBytes > shared_.limits.unfinishedBytesOfUser) {
        endBeyond(limitReached("unfinished_bytes_of_user", shared_.limits.unfinishedBytesOfUser));
    }
}

void LinuxConnection::endUnfinished() {
    {
        const MutexLock lock(mutex_);
        if (isFlooded_ || isReadable_) {
            // The client is not the one who is slow.
            shared_.unfinished.note(*this, unfinishedPlace_);
            return;
        }
    }
    endBeyond({std::string(kProtocolErrorDomain), kLimitReached,
               formatted("frame_seconds: a frame made no progress for {} s", shared_.limits.frameSeconds)});
}

std::size_t LinuxConnection::decodeAndDispatch(std::span<const std::uint8_t> item) {
    const auto refusal = shared_.intake.decode(item);
    wire::Request& request = shared_.intake.request();
    if (refusal) {
        countRefusal(*refusal, request.method);
        refuse(*refusal);
        return 0;
    }
    if (request.method == wire::Method::killService && !mayKillService(peer_.user)) {
        refuseKill(request.id.value_or(0));
        return 0;
    }
    const std::size_t bytes = kRequestBytes + request.decodedBytes;
    requests_->tally().addRequest();
    counters::addAloneTo(counters::kFirstRequest + static_cast<std::size_t>(request.method), 1);
    if (request.method == wire::Method::sendMessage) {
        counters::addAlone(counters::Counter::messagesReceived);
    }
    dispatchRequest(*exportedObject_, request, *this);
    return bytes;
}

void LinuxConnection::addError(std::uint64_t id, const ReplyError& error) {
    const MutexLock lock(mutex_);
    wire::appendErrorReply(outgoing_, id, error);
    hasRefusals_ = true;
}

void LinuxConnection::refuseKill(std::uint64_t id) {
    counters::add(counters::Counter::requestsRefusedNotAllowed);
    countError(wire::Method::killService, counters::RequestError::notAllowed);
    // The code is that of a limit, but none is reached.
    addError(id, {std::string(kProtocolErrorDomain), kLimitReached,
                  "killService is for root and the service's own user"});
    if (!std::exchange(isKillNoted_, true)) {
        shared_.log.reportOfClient(LogLevel::error, "zrrs",
                                   "a client may not end the service, and tried to. pid={} uid={}",
                                   peer_.process, peer_.user);
    }
}

void LinuxConnection::refuse(const wire::Refusal& refusal) {
    addError(refusal.id, refusal.error);
    if (refusal.error.code == kLimitReached) {
        noteLimit(refusal.error.message);
    }
    if (refusal.endsConnection) {
        beginEnd(Ending::interrupted);
    }
}

/// Once for all of a read: a system call each would make refusals dearer than requests.
void LinuxConnection::sendRefusals() {
    const MutexLock lock(mutex_);
    if (std::exchange(hasRefusals_, false)) {
        send();
    }
}

void LinuxConnection::noteLimit(std::string_view limit) {
    counters::addLimit(limit);
    if (!isLimitNoted_.exchange(true)) {
        const LogOrigin origin(peer_);
        shared_.log.reportOfClient(LogLevel::error, "zrrs", "a client is refused: {}. pid={} uid={}", limit,
                                   peer_.process, peer_.user);
    }
}

void LinuxConnection::endBeyond(const ReplyError& limit) {
    if (ending_ == Ending::none) {
        refuse({.endsConnection = true, .error = limit});
        sendRefusals();
    }
}

void LinuxConnection::turnAway(const ReplyError& reason) {
    // One line tells of all that are turned away until the user has fewer.
    isLimitNoted_ = std::exchange(user_->isTurnedAway, true);
    refuse({.error = reason});
    sendRefusals();
}

void LinuxConnection::carriedOut(std::size_t requests, std::size_t bytes) {
    waitingRequests_ -= requests;
    waitingBytes_ -= bytes;
    user_->waitingBytes -= bytes;
    readOn();
    readOnOthers();
}

/// Lets some of the user's connections be read on that were held back, if there is room: what each brings
/// calls the next of them, so that thousands are not woken for the room of one.
void LinuxConnection::readOnOthers() {
    if (user_->waitingBytes > shared_.limits.waitingBytesOfUser) {
        return;
    }
    for (int i = 0; i < kReadOnAtOnce; ++i) {
        std::shared_ptr<LinuxConnection> next;
        {
            const MutexLock lock(user_->mutex);
            if (user_->heldBack.empty()) {
                return;
            }
            next = std::move(user_->heldBack.front());
            user_->heldBack.pop_front();
        }
        next->readOn();
    }
}

/// Whether it still waits too much is looked at when it is its turn to be read.
void LinuxConnection::readOn() {
    const MutexLock lock(mutex_);
    if (std::exchange(isFlooded_, false)) {
        watch();
    }
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
                      std::generic_category().message(errno), peer_.process));
        counters::add(counters::Counter::connectionsUnwatched);
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
    countUnfinished();
    // What was read before is carried out, and answered, first. Replies go at the end of a batch, so the end
    // of the connection waits for the batch after the one that carries out the last request.
    requests_->post([self = shared_from_this()]() mutable {
        SerialQueue& queue = self->shared_.intake.serverQueue();
        queue.post([self = std::move(self)] { self->shared_.loop.post([self] { self->end(); }); });
    });
}

/// Waits for a peer that sends no more and is still to take replies. Whether it is.
bool LinuxConnection::beginWaitForPeer() {
    const MutexLock lock(mutex_);
    isWaitingForPeer_ = ending_ == Ending::orderly && unsent() != 0 && !isUnwritable_ && !isPatienceOver_;
    return isWaitingForPeer_;
}

void LinuxConnection::end() {
    if (!ended_) {
        return;
    }
    const LogOrigin origin(peer_);
    if (beginWaitForPeer()) {
        const MutexLock lock(mutex_);
        shared_.loop.callAfter(kPatienceWithPeer, [self = shared_from_this(), read = readByPeer()] {
            {
                const MutexLock held(self->mutex_);
                self->isPatienceOver_ = self->readByPeer() == read;
            }
            self->end();
        });
        return;
    }
    if (ending_ == Ending::interrupted && interruptionHandler_) {
        interruptionHandler_();
    }
    if (invalidationHandler_) {
        invalidationHandler_();
    }
    counters::add(ending_ == Ending::orderly ? counters::Counter::connectionsEndedOrderly
                                             : counters::Counter::connectionsEndedInterrupted);
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
        sent_ = 0;
        countUnsent();
        watch();
        socket_.reset();
    }
    readOnOthers();
    std::exchange(ended_, Ended())(shared_from_this());
}

} // namespace tamblo
