#include "platform/linux/status/StatusSocket.h"

#include "base/Format.h"
#include "base/SplitText.h"
#include "os/StreamSocket.h"
#include "platform/Counters.h"
#include "wire/StatusProtocol.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <new>
#include <set>
#include <string_view>
#include <utility>
#include <variant>

#include <poll.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <unistd.h>

namespace tamblo {

namespace {

using std::chrono::milliseconds;

/// The second that the service manager passes on.
constexpr int kPassedOnSocket = 4;
/// Who sends nothing for so long wants the status.
constexpr milliseconds kSilence{100};
/// For the rest of a line that has begun.
constexpr milliseconds kTimeForLine{2000};
/// For what the server queue is asked; and for each time that a reader takes something.
constexpr milliseconds kTimeForAnswer{5000};
constexpr milliseconds kTimeForReading{5000};
/// However steadily it reads: others wait for its place.
constexpr milliseconds kTimeForReader{30000};
/// How long accepting rests when no descriptors are left.
constexpr milliseconds kAcceptPause{100};
constexpr std::string_view kTap = "tap";

bool isTap(const StatusQuestion& question) noexcept {
    return !question.isHttp && (question.line == kTap || question.line.starts_with("tap "));
}

std::string errorText(std::string_view error) {
    return std::string("{\"error\":\"").append(error).append("\"}\n");
}

} // namespace

/// Has the wait for readers end; held by whoever may still answer.
class StatusSocket::WakeUp {
public:
    WakeUp() : descriptor_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}
    void call() const noexcept {
        const std::uint64_t one = 1;
        [[maybe_unused]] const ssize_t bytes = ::write(descriptor_.get(), &one, sizeof one);
    }
    void take() const noexcept {
        std::uint64_t calls = 0;
        [[maybe_unused]] const ssize_t bytes = ::read(descriptor_.get(), &calls, sizeof calls);
    }
    [[nodiscard]] int get() const noexcept { return descriptor_.get(); }

private:
    FileDescriptor descriptor_;
};

/// What several readers may wait for.
struct StatusSocket::Answer {
    Mutex mutex{};
    StatusAnswers::Text make TAMBLO_GUARDED_BY(mutex){};
    std::shared_ptr<const std::string> text TAMBLO_GUARDED_BY(mutex){};
};

struct StatusSocket::Reader {
    enum class State : std::uint8_t { asking, waiting, reading };

    FileDescriptor socket{};
    uid_t user = 0;
    Time deadline{};
    Time ends{};
    State state = State::asking;
    std::string received{};
    StatusQuestion question{};
    StatusRequest request{};
    std::shared_ptr<Answer> answer{};
    std::string head{};
    std::shared_ptr<const std::string> text{};
    std::size_t sent = 0; ///< of both
};

StatusSocket::StatusSocket(EventLoop& loop, WorkQueues& queues, StructuredLog& log, StatusAnswers& answers)
    : loop_(loop), queues_(queues), log_(log), answers_(answers), wakeUp_(std::make_shared<WakeUp>()) {}

StatusSocket::~StatusSocket() = default;

std::optional<std::string> StatusSocket::open(const std::string& runtimeDirectory) {
    // Who has the first socket is the service, whatever another one that lost it still answers.
    return ListeningSocket::passedOn() > 1
               ? socket_.adopt(kPassedOnSocket)
               : socket_.bind(wire::statusSocketPath(runtimeDirectory), ListeningSocket::IfAnswered::replace);
}

void StatusSocket::resume() {
    if (!socket_.isOpen()) {
        return;
    }
    queue_ = queues_.makeSerialQueue("com.vandra.tamblo.status");
    const MutexLock lock(mutex_);
    isStopped_ = false;
    isWatched_ = loop_.add(socket_.get(), EPOLLIN, *this);
}

void StatusSocket::ready(std::uint32_t) {
    const MutexLock lock(mutex_);
    if (std::exchange(isWatched_, false)) {
        loop_.remove(socket_.get());
        queue_->post([this] { serve(); }, Pace::mayBlock);
    }
}

void StatusSocket::stop() {
    const MutexLock lock(mutex_);
    isStopped_ = true;
    if (std::exchange(isWatched_, false)) {
        loop_.remove(socket_.get());
    }
    socket_.removeFile();
    wakeUp_->call();
}

bool StatusSocket::isStopped() {
    const MutexLock lock(mutex_);
    return isStopped_;
}

void StatusSocket::serve() {
    bool hasReaders = true;
    while (hasReaders && !isStopped()) {
        try {
            acceptReaders();
            hasReaders = waitForReaders();
        } catch (const std::bad_alloc&) {
            log_.report(LogLevel::error, "zrrs", "readers of the status are let go: no memory is left");
            counters::add(counters::Counter::statusReadersNoMemory, readers_.size());
            readers_.clear();
            hasReaders = false;
        }
    }
    readers_ = std::vector<Reader>();
    const MutexLock lock(mutex_);
    if (!isStopped_) {
        isWatched_ = loop_.add(socket_.get(), EPOLLIN, *this);
    }
}

/// Waits for what the readers do next, and does what follows; whether there are readers left.
bool StatusSocket::waitForReaders() {
    if (readers_.empty() && acceptsFrom_ == Time()) {
        return false;
    }
    std::array<pollfd, kMostReaders + 2> polled{};
    polled[0] = {.fd = wakeUp_->get(), .events = POLLIN, .revents = 0};
    polled[1] = {.fd = acceptsFrom_ == Time() ? socket_.get() : -1, .events = POLLIN, .revents = 0};
    for (std::size_t i = 0; i != readers_.size(); ++i) {
        const Reader& reader = readers_[i];
        short wanted = 0;
        if (reader.state == Reader::State::asking) {
            wanted = POLLIN;
        } else if (reader.state == Reader::State::reading) {
            wanted = POLLOUT;
        }
        polled[i + 2] = {.fd = reader.socket.get(), .events = wanted, .revents = 0};
    }
    if (::poll(polled.data(), readers_.size() + 2, timeLeft()) < 0 && errno != EINTR) {
        return false;
    }
    wakeUp_->take();
    const Time now = std::chrono::steady_clock::now();
    for (std::size_t i = 0; i != readers_.size(); ++i) {
        step(readers_[i], polled[i + 2].revents, now);
    }
    std::erase_if(readers_, [](const Reader& reader) { return !reader.socket.isOpen(); });
    return true;
}

/// Milliseconds until something is due.
int StatusSocket::timeLeft() const {
    Time first = acceptsFrom_ == Time() ? Time::max() : acceptsFrom_;
    for (const Reader& reader : readers_) {
        first = std::min(first, reader.deadline);
    }
    const auto left = std::chrono::ceil<milliseconds>(first - std::chrono::steady_clock::now());
    return static_cast<int>(std::max<milliseconds::rep>(left.count(), 0));
}

void StatusSocket::acceptReaders() {
    if (acceptsFrom_ > std::chrono::steady_clock::now()) {
        return;
    }
    acceptsFrom_ = Time();
    for (;;) {
        FileDescriptor socket(::accept4(socket_.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
        if (!socket.isOpen()) {
            if (errno == EMFILE || errno == ENFILE || errno == ENOBUFS || errno == ENOMEM) {
                acceptsFrom_ = std::chrono::steady_clock::now() + kAcceptPause;
            }
            return;
        }
        const uid_t user = peerUser(socket.get());
        if (!makeRoomFor(user)) {
            turnAway(std::move(socket));
            continue;
        }
        counters::add(counters::Counter::statusReaders);
        const Time now = std::chrono::steady_clock::now();
        readers_.push_back({.socket = std::move(socket),
                            .user = user,
                            .deadline = now + kSilence,
                            .ends = now + kTimeForReader});
    }
}

bool StatusSocket::makeRoomFor(uid_t user) {
    if (readers_.size() < kMostReaders) {
        return true;
    }
    const auto countOf = [this](uid_t other) { return std::ranges::count(readers_, other, &Reader::user); };
    // The first one of its user's has had most of its time.
    const auto most =
        std::ranges::max_element(readers_, {}, [&](const Reader& reader) { return countOf(reader.user); });
    if (countOf(most->user) < countOf(user) + 2) {
        return false;
    }
    counters::add(counters::Counter::statusReadersOfUser);
    close(*most);
    readers_.erase(most);
    return true;
}

void StatusSocket::turnAway(FileDescriptor socket) {
    counters::add(counters::Counter::statusReadersTurnedAway);
    Reader reader{.socket = std::move(socket)};
    const std::string text = errorText(formatted("{} readers are served already; try again", kMostReaders));
    (void)::send(reader.socket.get(), text.data(), text.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
    close(reader);
}

void StatusSocket::step(Reader& reader, short events, Time now) {
    if (reader.state == Reader::State::asking && (events & (POLLIN | POLLHUP)) != 0) {
        receive(reader, now);
    }
    if (reader.state == Reader::State::asking && reader.deadline <= now) {
        ask(reader, now);
    }
    if (reader.state == Reader::State::waiting) {
        takeAnswer(reader, now);
    }
    if (reader.state == Reader::State::reading) {
        send(reader, now);
    }
    if ((events & POLLERR) != 0 || (reader.state != Reader::State::asking && (events & POLLHUP) != 0)) {
        reader.socket.reset();
    }
}

void StatusSocket::receive(Reader& reader, Time now) {
    std::array<char, kMostBytesOfLine> bytes;
    const ssize_t count = ::recv(reader.socket.get(), bytes.data(), bytes.size(), MSG_DONTWAIT);
    if (count < 0) {
        return;
    }
    if (reader.received.empty()) {
        reader.deadline = now + kTimeForLine;
    }
    reader.received.append(bytes.data(), static_cast<std::size_t>(count));
    if (reader.received.size() > kMostBytesOfLine) {
        reader.question = StatusQuestion::of(reader.received);
        refuse(reader, formatted("a line or header has at most {} bytes", kMostBytesOfLine), now);
    } else if (count == 0 || StatusQuestion::isWhole(reader.received)) {
        ask(reader, now);
    }
}

/// With what has been received by now.
void StatusSocket::ask(Reader& reader, Time now) {
    reader.question = StatusQuestion::of(reader.received);
    reader.received = std::string();
    if (isTap(reader.question)) {
        // From now on the reader is the taps'.
        reader.deadline = Time::max();
        takeTap_(std::move(reader.socket),
                 trimmed(std::string_view(reader.question.line).substr(kTap.size())));
        return;
    }
    reader.state = Reader::State::waiting;
    reader.deadline = now + kTimeForAnswer;
    const auto parsed = StatusRequest::parse(reader.question.line);
    if (const auto* const wrong = std::get_if<std::string>(&parsed)) {
        return refuse(reader, *wrong, now);
    }
    reader.request = std::get<StatusRequest>(parsed);
    // Those who ask for the same at the same time share it.
    const auto other = std::ranges::find_if(readers_, [&reader](const Reader& known) {
        return known.answer != nullptr && known.request == reader.request;
    });
    if (other != readers_.end()) {
        reader.answer = other->answer;
        return;
    }
    reader.answer = std::make_shared<Answer>();
    answers_.answer(reader.request, [answer = reader.answer, wakeUp = wakeUp_](StatusAnswers::Text text) {
        const MutexLock lock(answer->mutex);
        answer->make = std::move(text);
        wakeUp->call();
    });
}

void StatusSocket::takeAnswer(Reader& reader, Time now) {
    const std::shared_ptr<Answer> answer = reader.answer;
    const MutexLock lock(answer->mutex);
    if (answer->make) {
        answer->text = std::make_shared<const std::string>(std::exchange(answer->make, {})());
    }
    if (answer->text == nullptr && reader.deadline > now) {
        return;
    }
    reader.answer.reset();
    if (answer->text == nullptr) {
        counters::add(counters::Counter::statusReadersUnanswered);
        refuse(reader, "the server queue does not answer", now);
    } else if (!hasRoomFor(answer->text)) {
        counters::add(counters::Counter::statusReadersNoMemory);
        refuse(reader, "too much is being read already; try again", now);
    } else {
        reply(reader, answer->text, &reader.request, now);
    }
}

void StatusSocket::reply(Reader& reader, std::shared_ptr<const std::string> text,
                         const StatusRequest* request, Time now) {
    reader.head = reader.question.headOf(text->size(), request);
    reader.text = std::move(text);
    reader.state = Reader::State::reading;
    reader.deadline = std::min(now + kTimeForReading, reader.ends);
}

void StatusSocket::refuse(Reader& reader, std::string_view error, Time now) {
    reply(reader, std::make_shared<const std::string>(errorText(error)), nullptr, now);
}

bool StatusSocket::hasRoomFor(const std::shared_ptr<const std::string>& text) const {
    std::set<std::shared_ptr<const std::string>> read;
    std::size_t bytes = text->size();
    for (const Reader& reader : readers_) {
        if (reader.text != nullptr && reader.text != text && read.insert(reader.text).second) {
            bytes += reader.text->size();
        }
    }
    return read.empty() || bytes <= kMostBytes;
}

void StatusSocket::send(Reader& reader, Time now) {
    const std::size_t head = reader.head.size();
    const std::string_view rest = reader.sent < head
                                      ? std::string_view(reader.head).substr(reader.sent)
                                      : std::string_view(*reader.text).substr(reader.sent - head);
    const ssize_t count = ::send(reader.socket.get(), rest.data(), rest.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
    if (count > 0) {
        reader.sent += static_cast<std::size_t>(count);
        reader.deadline = std::min(now + kTimeForReading, reader.ends);
    }
    const bool isRefused = count < 0 && errno != EAGAIN && errno != EINTR;
    if (reader.deadline <= now) {
        counters::add(counters::Counter::statusReadersSilent);
    }
    if (reader.sent == head + reader.text->size() || isRefused || reader.deadline <= now) {
        close(reader);
    }
}

void StatusSocket::close(Reader& reader) {
    closeInOrder(std::move(reader.socket));
}

} // namespace tamblo
