#include "client/Engine.h"

#include "os/LocalAddress.h"
#include "wire/FrameSplitter.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <algorithm>
#include <bit>
#include <cerrno>
#include <ctime>
#include <span>
#include <utility>

#include <fcntl.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/uio.h>
#include <unistd.h>

namespace tamblo::client {

using std::chrono::milliseconds;

namespace {

/// Sets a variable for a scope: memory may run out within it, and the next call has to find it as it was.
template <typename Variable, typename Set> class Scoped {
public:
    Scoped(Variable& variable, Set value) : variable_(variable) { variable_ = value; }
    ~Scoped() { variable_ = Set{}; }
    Scoped(const Scoped&) = delete;
    Scoped& operator=(const Scoped&) = delete;

private:
    Variable& variable_;
};

} // namespace

Engine::Engine(Options options) : options_(std::move(options)), queue_(options_.queueCapacity) {
    (void)received_.room(kReadBytes);
    if (options_.wakeable) {
        wakeUp_ = FileDescriptor(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
    }
}

Engine::~Engine() {
    close();
}

OutgoingFrame* Engine::outgoing() noexcept {
    if (goesAhead()) [[unlikely]] {
        return &prologue_.emplace_back();
    }
    return isClosed_.load(std::memory_order_relaxed) ? nullptr : queue_.claim();
}

void Engine::publish(OutgoingFrame& frame) noexcept {
    if (goesAhead()) [[unlikely]] {
        return;
    }
    auto& slot = static_cast<SendQueue::Slot&>(frame);
    if (!wakeUp_.isOpen()) {
        queue_.publish(slot, std::memory_order_release);
        return;
    }
    // In the one total order of these operations and those of `mayFallAsleep`, either the pumping thread sees
    // the frame before it sleeps, or this thread sees that it sleeps.
    queue_.publish(slot, std::memory_order_seq_cst);
    if (isAsleep_.load(std::memory_order_seq_cst) && isAsleep_.exchange(false)) {
        writeWakeUp();
    }
}

void Engine::abandon(OutgoingFrame& frame) noexcept {
    frame.frame.clear();
    frame.reply.reset();
    publish(frame);
}

void Engine::wake() noexcept {
    isWakeWanted_.store(true);
    writeWakeUp();
}

void Engine::writeWakeUp() noexcept {
    const std::uint64_t one = 1;
    (void)!::write(wakeUp_.get(), &one, sizeof one);
}

OutgoingFrame* Engine::frameAt(std::size_t index) noexcept {
    if (index < prologue_.size()) {
        return &prologue_[index];
    }
    return queue_.peek(index - prologue_.size());
}

// Connecting

bool Engine::open() {
    const auto address = LocalAddress::of(options_.socketPath);
    FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!address || ::connect(socket.get(), address->get(), address->size()) != 0) {
        return false;
    }
    if (!options_.wakeable) {
        // One call then both waits for a reply and reads it; what must not wait says so call by call.
        (void)::fcntl(socket.get(), F_SETFL, 0);
    }
    socket_ = std::move(socket);
    return true;
}

bool Engine::connect() {
    if (socket_.isOpen() || isAnnouncing_ || isClosed_) {
        return socket_.isOpen();
    }
    lastAttempt_ = Clock::now();
    hadWaiting_ = !isFlushed();
    if (!open()) {
        delay_ = std::clamp(2 * delay_, kFirstDelay, kLongestDelay);
        if (options_.reconnect && !announcedReconnecting_) {
            announcedReconnecting_ = true;
            announce(ConnectionState::reconnecting);
        }
        return false;
    }
    delay_ = milliseconds{0};
    announcedReconnecting_ = false;
    sentOfFirst_ = 0;
    socketIsFull_ = false;
    receiveTimeout_ = milliseconds{0};
    received_.clear();
    isConnected_.store(true, std::memory_order_relaxed);
    announce(ConnectionState::connected);
    return true;
}

Engine::Clock::time_point Engine::nextAttempt(bool framesWait) const noexcept {
    const bool areFirst = framesWait && !hadWaiting_;
    return lastAttempt_ + (areFirst ? std::min(delay_, kFirstDelay) : delay_);
}

void Engine::announce(ConnectionState state) {
    hasNews_ = true;
    if (!options_.onState) {
        return;
    }
    const bool goesAhead = state == ConnectionState::connected;
    const Scoped announcing(isAnnouncing_, true);
    const Scoped thread(announcingThread_, goesAhead ? std::this_thread::get_id() : std::thread::id());
    options_.onState(state);
}

void Engine::disconnect() noexcept {
    socket_.reset();
    isConnected_.store(false, std::memory_order_relaxed);
}

void Engine::lose() {
    disconnect();
    delay_ = kFirstDelay;
    lastAttempt_ = Clock::now();
    hadWaiting_ = !isFlushed();
    pending_.failAll(makeError(ErrorCode::connectionLost));
    failPrologue(ErrorCode::connectionLost);
    announce(ConnectionState::lost);
    if (options_.reconnect && !isClosed_) {
        announcedReconnecting_ = true;
        announce(ConnectionState::reconnecting);
    }
}

void Engine::failFrame(OutgoingFrame& frame, ErrorCode code) {
    ReplyFunction reply = std::move(frame.reply);
    if (frame.id != 0) {
        pending_.cancel(std::exchange(frame.id, 0));
    }
    if (reply) {
        hasNews_ = true;
        const Error error = makeError(code);
        reply({.error = &error});
    }
}

void Engine::failPrologue(ErrorCode code) {
    while (!prologue_.empty()) {
        failFrame(prologue_.front(), code);
        prologue_.pop_front();
    }
}

void Engine::failWaiting(ErrorCode code) {
    failPrologue(code);
    // No more than a queue's length: those who are told may send again at once.
    for (std::size_t i = 0; i < queue_.capacity(); ++i) {
        OutgoingFrame* const frame = queue_.peek(0);
        if (frame == nullptr) {
            return;
        }
        failFrame(*frame, code);
        queue_.pop();
    }
}

void Engine::close() {
    if (isClosed_) {
        return;
    }
    isClosed_ = true;
    options_.onState.reset();
    disconnect();
    pending_.failAll(makeError(ErrorCode::closed));
    failWaiting(ErrorCode::closed);
}

// Sending

bool Engine::assignId(OutgoingFrame& frame) {
    if (!frame.reply || frame.id != 0) {
        return true;
    }
    const auto id = pending_.reserve();
    if (!id) {
        return false;
    }
    frame.id = *id;
    wire::replaceId(frame.frame, *id);
    return true;
}

void Engine::send() {
    while (socket_.isOpen()) {
        iovec pieces[kFramesPerSend];
        std::size_t count = 0;
        while (count < kFramesPerSend) {
            OutgoingFrame* const frame = frameAt(count);
            if (frame == nullptr) {
                break;
            }
            if (!assignId(*frame)) [[unlikely]] {
                frame->frame.clear();
            }
            pieces[count++] = {frame->frame.data(), frame->frame.size()};
        }
        if (count == 0) {
            return;
        }
        pieces[0].iov_base = static_cast<char*>(pieces[0].iov_base) + sentOfFirst_;
        pieces[0].iov_len -= sentOfFirst_;
        if (!sendPieces({pieces, count})) {
            return;
        }
    }
}

bool Engine::sendPieces(std::span<iovec> pieces) {
    std::size_t wanted = 0;
    for (const iovec& piece : pieces) {
        wanted += piece.iov_len;
    }
    msghdr message{};
    message.msg_iov = pieces.data();
    message.msg_iovlen = pieces.size();
    const ssize_t sent = ::sendmsg(socket_.get(), &message, MSG_NOSIGNAL | MSG_DONTWAIT);
    if (sent < 0) {
        if (errno == EINTR) {
            return true;
        }
        // Also when the connection has ended: replies may still lie there to be read, and the end is found by
        // reading.
        socketIsFull_ = true;
        return false;
    }
    dropSent(static_cast<std::size_t>(sent), pieces.size());
    socketIsFull_ = static_cast<std::size_t>(sent) < wanted;
    return !socketIsFull_;
}

void Engine::dropSent(std::size_t bytes, std::size_t frames) {
    sentOfFirst_ += bytes;
    for (std::size_t i = 0; i < frames; ++i) {
        OutgoingFrame& first = *frameAt(0);
        const std::size_t size = first.frame.size();
        if (sentOfFirst_ < size) {
            return;
        }
        sentOfFirst_ -= size;
        if (first.id != 0) {
            pending_.expect(std::exchange(first.id, 0), std::move(first.reply), first.wantsEveryReply);
        } else if (first.reply) [[unlikely]] {
            failFrame(first, ErrorCode::tooManyPending);
        }
        if (!prologue_.empty()) {
            prologue_.pop_front();
        } else {
            queue_.pop();
        }
    }
}

// Receiving

std::size_t Engine::readReplies(int flags) {
    const std::size_t room = std::max(kReadBytes - std::min(kReadBytes, received_.size()), wantedBytes_);
    char* const to = received_.room(room);
    const ssize_t count = ::recv(socket_.get(), to, room, flags | MSG_NOSIGNAL);
    if (count <= 0) {
        if (count == 0 || (errno != EAGAIN && errno != EINTR)) {
            lose();
        }
        return 0;
    }
    received_.commit(static_cast<std::size_t>(count));
    return handleReceived();
}

std::size_t Engine::handleReceived() {
    wire::FrameSplitter frames(received_.bytes());
    std::size_t handled = 0;
    while (const auto item = frames.next()) {
        handled += handleReply(*item) ? 1 : 0;
    }
    if (frames.tooLong()) {
        lose();
        return handled;
    }
    const std::size_t rest = frames.rest().size();
    wantedBytes_ = rest == 0 ? 0 : frames.wanted() - rest;
    received_.dropFront(received_.size() - rest);
    if (rest == 0 && received_.capacity() > 2 * kReadBytes) {
        received_.reset();
    }
    return handled;
}

bool Engine::handleReply(std::span<const std::uint8_t> item) {
    const auto reply = wire::decodeReply(item);
    return reply && pending_.deliver(reply->id, {.error = reply->error ? &*reply->error : nullptr,
                                                 .value = reply->result ? &*reply->result : nullptr});
}

// Pumping

std::size_t Engine::pump(milliseconds timeout) {
    if (isPumping_ || isClosed_) {
        return 0;
    }
    const Scoped pumping(isPumping_, true);
    const Clock::time_point deadline = Clock::now() + timeout;
    hasNews_ = false;
    std::size_t handled = 0;
    do {
        if (!socket_.isOpen() && Clock::now() >= nextAttempt(!isFlushed())) {
            connect();
        }
        send();
        if (!socket_.isOpen() && !options_.reconnect) {
            failWaiting(ErrorCode::connectionLost);
        }
        if (hasNews_) {
            break;
        }
        handled = waitAndReceive(deadline);
    } while (handled == 0 && !hasNews_ && !isWakeWanted_.exchange(false) && Clock::now() < deadline);
    return handled;
}

std::size_t Engine::waitAndReceive(Clock::time_point deadline) {
    if (!socket_.isOpen()) {
        if (!options_.reconnect) {
            (void)sleepUntil(deadline, true);
            return 0;
        }
        // The first frame brings the next attempt forward; more of them change nothing.
        const bool framesWait = !isFlushed();
        (void)sleepUntil(std::min(deadline, nextAttempt(framesWait)), !framesWait);
        return 0;
    }
    const auto left = std::chrono::floor<milliseconds>(deadline - Clock::now());
    if (left <= milliseconds{0}) {
        return readReplies(MSG_DONTWAIT);
    }
    // The time is cut to a power of two, so that the socket's own limit seldom has to be set anew.
    constexpr milliseconds shortest{8};
    if (!options_.wakeable && !socketIsFull_ && left >= shortest &&
        setReceiveTimeout(milliseconds(std::bit_floor(static_cast<std::uint64_t>(left.count()))))) {
        return readReplies(0);
    }
    return sleepUntil(deadline, !socketIsFull_) ? readReplies(MSG_DONTWAIT) : 0;
}

bool Engine::setReceiveTimeout(milliseconds timeout) noexcept {
    constexpr milliseconds longest{1 << 20};
    timeout = std::min(timeout, longest);
    if (timeout == receiveTimeout_) {
        return true;
    }
    const timeval value{.tv_sec = timeout.count() / 1000, .tv_usec = timeout.count() % 1000 * 1000};
    if (::setsockopt(socket_.get(), SOL_SOCKET, SO_RCVTIMEO, &value, sizeof value) != 0) {
        return false;
    }
    receiveTimeout_ = timeout;
    return true;
}

bool Engine::sleepUntil(Clock::time_point time, bool framesWake) {
    if (framesWake && !mayFallAsleep()) {
        return false;
    }
    pollfd watched[2] = {{.fd = wakeUp_.get(), .events = POLLIN, .revents = 0},
                         {.fd = socket_.get(), .events = POLLIN, .revents = 0}};
    if (socketIsFull_) {
        watched[1].events |= POLLOUT;
    }
    const auto left = std::max(time - Clock::now(), Clock::duration::zero());
    const auto seconds = std::chrono::floor<std::chrono::seconds>(left);
    const timespec timeout{.tv_sec = seconds.count(), .tv_nsec = (left - seconds).count()};
    const int ready = ::ppoll(watched, 2, &timeout, nullptr);
    isAsleep_.store(false, std::memory_order_relaxed);
    if (ready > 0 && watched[0].revents != 0) {
        std::uint64_t count = 0;
        (void)!::read(wakeUp_.get(), &count, sizeof count);
    }
    return ready > 0 && (watched[1].revents & ~POLLOUT) != 0;
}

bool Engine::mayFallAsleep() noexcept {
    if (!wakeUp_.isOpen()) {
        return true;
    }
    isAsleep_.store(true, std::memory_order_seq_cst);
    if (isFlushed()) {
        return true;
    }
    isAsleep_.store(false, std::memory_order_relaxed);
    return false;
}

} // namespace tamblo::client
