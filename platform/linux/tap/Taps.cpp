#include "platform/linux/tap/Taps.h"

#include "base/Format.h"
#include "base/Json.h"
#include "os/StreamSocket.h"
#include "platform/Counters.h"
#include "platform/linux/tap/LineQueue.h"
#include "platform/linux/tap/TapFilter.h"
#include "wire/EventNames.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <limits>
#include <new>
#include <string>
#include <utility>
#include <variant>

#include <sys/epoll.h>
#include <sys/socket.h>

namespace tamblo {

namespace {

/// What one wake-up sends to a reader at most.
constexpr std::size_t kBytesOfTurn = 64U << 10U;
/// What is kept of the room for a line.
constexpr std::size_t kKeptCapacity = 16U << 10U;
/// How late a reader hears of what was left out for want of time, when nothing else comes.
constexpr std::chrono::milliseconds kLatestTold{200};

std::string_view nameOf(TappedMessage::Origin origin) noexcept {
    switch (origin) {
    case TappedMessage::Origin::sent:
        return "message";
    case TappedMessage::Origin::derived:
        return "derived";
    case TappedMessage::Origin::session:
        break;
    }
    return "session";
}

void appendLine(TextBuffer& line, const TappedMessage& message, std::size_t largestPayload) {
    line.append("{\"time\":");
    appendJsonNumber(line, secondsSince1970(message.time));
    line.append(",\"reporter\":");
    appendJson(line, Value(message.reporterID));
    line.append(",\"service\":");
    appendJsonString(line, message.serviceName);
    line.append(message.isSessionStarted ? ",\"started\":true" : ",\"started\":false");
    line.append(",\"origin\":\"");
    line.append(nameOf(message.origin));
    line.append("\",\"event\":\"");
    line.append(wire::eventName(wire::kAllServices, message.category, message.type));
    line.append("\",\"category\":");
    appendJson(line, Value(message.category));
    line.append(",\"type\":");
    appendJson(line, Value(message.type));
    const std::size_t bytes = message.payload.bytesOfValues(Dictionary::Shared::inFull);
    if (bytes <= largestPayload) {
        line.append(",\"payload\":");
        appendJson(line, Value(message.payload));
    } else {
        line.append(",\"payload_left_out\":");
        appendJson(line, Value(static_cast<std::uint64_t>(bytes)));
    }
    line.append("}\n");
}

void sendWhatFits(int socket, std::string_view text) noexcept {
    static_cast<void>(::send(socket, text.data(), text.size(), MSG_DONTWAIT | MSG_NOSIGNAL));
}

void refuse(FileDescriptor reader, std::string_view reason) {
    TextBuffer line;
    line.append("{\"error\":");
    appendJsonString(line, reason);
    line.append("}\n");
    sendWhatFits(reader.get(), line.view());
    closeInOrder(std::move(reader));
}

} // namespace

/// One reader. What it waits for is written on the server queue and sent on the loop's thread.
class Taps::Tap final : public EventSource {
public:
    Tap(Taps& taps, FileDescriptor socket, TapFilter filter)
        : taps_(taps),
          socket_(std::move(socket)),
          user_(peerUser(socket_.get())),
          filter_(std::move(filter)) {}

    [[nodiscard]] bool isRecording() const noexcept { return filter_.isRecording; }
    [[nodiscard]] uid_t user() const noexcept { return user_; }
    [[nodiscard]] bool isEnding() const noexcept { return isEnding_; }
    /// Has the loop hear that the connection is over, and remove the tap. With the lock of all taps.
    void end() TAMBLO_EXCLUDES(mutex_);
    [[nodiscard]] bool watch() { return taps_.loop_.add(socket_.get(), 0, *this); }
    [[nodiscard]] FileDescriptor takeSocket() noexcept { return std::move(socket_); }
    /// On the server queue. `line` is the message's, once some tap of this kind has made it.
    void offer(const TappedMessage& message, TextBuffer& line) TAMBLO_EXCLUDES(mutex_);
    /// Messages that nobody has looked at; they do not count towards the limit.
    void leaveOut(std::uint64_t messages) TAMBLO_EXCLUDES(mutex_) {
        const MutexLock lock(mutex_);
        leftOut_ += messages;
        wait();
    }
    void ready(std::uint32_t events) override TAMBLO_EXCLUDES(mutex_);
    /// What the reader takes at once, and how much it has missed.
    void sendRest() TAMBLO_EXCLUDES(mutex_) {
        const MutexLock lock(mutex_);
        tellWhatIsLeftOut();
        for (std::size_t before = 0; before != out_.size() && !out_.empty();) {
            before = out_.size();
            (void)sendSome(before);
        }
    }

private:
    [[nodiscard]] bool isAtLimit() const noexcept TAMBLO_REQUIRES(mutex_) {
        return filter_.limit != 0 && shown_ == filter_.limit;
    }
    [[nodiscard]] std::size_t mostWaiting() const noexcept {
        return isRecording() ? kMostWaitingOfRecording : kMostWaiting;
    }
    void append(std::string_view line) TAMBLO_REQUIRES(mutex_);
    /// Until the reader takes something.
    void wait() TAMBLO_REQUIRES(mutex_);
    /// False when the reader is gone.
    [[nodiscard]] bool sendSome(std::size_t most) TAMBLO_REQUIRES(mutex_);
    void tellWhatIsLeftOut() TAMBLO_REQUIRES(mutex_);
    [[nodiscard]] bool goOn() TAMBLO_REQUIRES(mutex_);

    Taps& taps_;
    FileDescriptor socket_;
    const uid_t user_;
    const TapFilter filter_;
    std::uint64_t matched_ = 0; ///< the server queue's
    bool isEnding_ = false;     ///< under the lock of all taps

    Mutex mutex_;
    LineQueue out_ TAMBLO_GUARDED_BY(mutex_);
    std::uint64_t shown_ TAMBLO_GUARDED_BY(mutex_) = 0;
    std::uint64_t leftOut_ TAMBLO_GUARDED_BY(mutex_) = 0;
    bool isWriting_ TAMBLO_GUARDED_BY(mutex_) = false; ///< the loop waits until the reader takes more
};

void Taps::Tap::offer(const TappedMessage& message, TextBuffer& line) {
    if (!filter_.accepts(message) || matched_++ % filter_.sample != 0) {
        return;
    }
    const MutexLock lock(mutex_);
    if (isAtLimit()) {
        return;
    }
    ++shown_;
    // Once full it stays so until half of it is sent: else every message would be made into text to find that
    // it does not fit.
    if (leftOut_ != 0) {
        counters::add(counters::Counter::tapMessages);
        ++leftOut_;
        return;
    }
    try {
        if (line.empty()) {
            appendLine(line, message,
                       isRecording() ? std::numeric_limits<std::size_t>::max() : kLargestPayload);
        }
        if (out_.size() + line.size() <= mostWaiting()) {
            append(line.view());
            return;
        }
    } catch (const std::bad_alloc&) {
        line.clear();
    }
    counters::add(counters::Counter::tapMessages);
    ++leftOut_;
    wait();
}

void Taps::Tap::end() {
    const MutexLock lock(mutex_);
    isEnding_ = true;
    if (sendSome(kMostWaiting) && out_.empty()) {
        sendWhatFits(socket_.get(), "{\"error\":\"tap: another user needs the place\"}\n");
    }
    ::shutdown(socket_.get(), SHUT_RDWR);
}

void Taps::Tap::append(std::string_view line) {
    out_.append(line);
    wait();
}

void Taps::Tap::wait() {
    if (!std::exchange(isWriting_, true)) {
        taps_.loop_.modify(socket_.get(), EPOLLOUT, *this);
    }
}

void Taps::Tap::tellWhatIsLeftOut() {
    if (leftOut_ != 0) {
        append(formatted("{\"left_out\":{}}\n", std::exchange(leftOut_, 0)));
    }
}

void Taps::Tap::ready(std::uint32_t events) {
    bool goesOn = (events & (EPOLLERR | EPOLLHUP)) == 0;
    if (goesOn) {
        const MutexLock lock(mutex_);
        goesOn = sendSome(kBytesOfTurn) && goOn();
    }
    if (!goesOn) {
        taps_.remove(*this);
    }
}

bool Taps::Tap::sendSome(std::size_t most) {
    const std::string_view rest = out_.front(most);
    const ssize_t count = ::send(socket_.get(), rest.data(), rest.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
    if (count < 0) {
        return errno == EAGAIN || errno == EWOULDBLOCK || errno == EINTR;
    }
    out_.drop(static_cast<std::size_t>(count));
    return true;
}

/// What follows when some was sent; whether the reader is to be shown more.
bool Taps::Tap::goOn() {
    if (out_.size() <= mostWaiting() / 2) {
        tellWhatIsLeftOut();
    }
    if (!out_.empty()) {
        return true;
    }
    isWriting_ = false;
    taps_.loop_.modify(socket_.get(), 0, *this);
    return !isAtLimit();
}

Taps::~Taps() {
    const MutexLock lock(mutex_);
    tellWhatIsLeftOut();
    for (const std::shared_ptr<Tap>& tap : taps_) {
        tap->sendRest();
    }
}

void Taps::add(FileDescriptor reader, std::string_view filter) {
    auto parsed = TapFilter::parse(filter);
    if (const auto* const wrong = std::get_if<std::string>(&parsed)) {
        refuse(std::move(reader), *wrong);
        return;
    }
    auto tap = std::make_shared<Tap>(*this, std::move(reader), std::get<TapFilter>(std::move(parsed)));
    const MutexLock lock(mutex_);
    const bool isSecond = tap->isRecording() &&
                          std::ranges::any_of(taps_, [](const auto& open) { return open->isRecording(); });
    if (isSecond || !makeRoomFor(tap->user()) || !tap->watch()) {
        counters::add(counters::Counter::tapsTurnedAway);
        refuse(tap->takeSocket(), isSecond ? "tap: there is a recording, and one at a time is made"
                                           : formatted("tap: there are {} taps at most", kMostTaps));
        return;
    }
    counters::add(counters::Counter::taps);
    tellWhatIsLeftOut();
    taps_.push_back(std::move(tap));
    setOpen(true);
}

std::size_t Taps::openTapsOf(uid_t user) const {
    return static_cast<std::size_t>(std::ranges::count_if(
        taps_, [user](const std::shared_ptr<Tap>& tap) { return tap->user() == user && !tap->isEnding(); }));
}

bool Taps::makeRoomFor(uid_t user) {
    if (std::cmp_less(std::ranges::count(taps_, false, &Tap::isEnding), kMostTaps)) {
        return true;
    }
    Tap* found = nullptr; // of the user with most
    std::size_t most = 0;
    for (const std::shared_ptr<Tap>& tap : taps_) {
        const std::size_t count = openTapsOf(tap->user());
        if (!tap->isEnding() && count > most) {
            found = tap.get();
            most = count;
        }
    }
    if (most < openTapsOf(user) + 2) {
        return false;
    }
    counters::add(counters::Counter::tapsOfUser);
    found->end();
    return true;
}

void Taps::offer(const TappedMessage& message) {
    line_.clearAndKeep(kKeptCapacity);
    whole_.clearAndKeep(kKeptCapacity);
    const MutexLock lock(mutex_);
    offerTo(true, message, whole_);
    const auto began = now_();
    if (!hasTime(began)) {
        return;
    }
    offerTo(false, message, line_);
    credit_ -= now_() - began;
}

void Taps::offerTo(bool areRecordings, const TappedMessage& message, TextBuffer& line) {
    for (const std::shared_ptr<Tap>& tap : taps_) {
        if (tap->isRecording() == areRecordings) {
            tap->offer(message, line);
        }
    }
}

bool Taps::hasTime(std::chrono::steady_clock::time_point now) {
    credit_ = std::min<std::chrono::nanoseconds>(kMostCredit,
                                                 credit_ + (now - std::exchange(creditOf_, now)) / kShare);
    if (isOutOfTime_ ? credit_ >= kMostCredit / 4 : credit_.count() > 0) {
        isOutOfTime_ = false;
        tellWhatIsLeftOut();
        return true;
    }
    isOutOfTime_ = true;
    counters::add(counters::Counter::tapMessages,
                  static_cast<std::uint64_t>(std::ranges::count(taps_, false, &Tap::isRecording)));
    if (leftOut_++ == 0) {
        loop_.post([this] {
            loop_.callAfter(kLatestTold, [this] {
                const MutexLock lock(mutex_);
                tellWhatIsLeftOut();
            });
        });
    }
    return false;
}

void Taps::tellWhatIsLeftOut() {
    if (const std::uint64_t leftOut = std::exchange(leftOut_, 0)) {
        for (const std::shared_ptr<Tap>& tap : taps_) {
            if (!tap->isRecording()) {
                tap->leaveOut(leftOut);
            }
        }
    }
}

void Taps::remove(const Tap& tap) {
    const MutexLock lock(mutex_);
    const auto found =
        std::ranges::find(taps_, &tap, [](const std::shared_ptr<Tap>& known) { return known.get(); });
    if (found == taps_.end()) {
        return;
    }
    std::shared_ptr<Tap> removed = std::move(*found);
    taps_.erase(found);
    setOpen(!taps_.empty());
    const FileDescriptor socket = removed->takeSocket();
    loop_.remove(socket.get());
    // The events of this wake-up may still name it.
    loop_.post([removed = std::move(removed)] {});
}

} // namespace tamblo
