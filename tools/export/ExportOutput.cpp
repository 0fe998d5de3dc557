#include "tools/export/ExportOutput.h"

#include "base/Format.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstring>
#include <iterator>
#include <utility>

#include <linux/sockios.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tamblo::tools {

namespace {

using std::chrono::nanoseconds;

/// What has been begun may go on for so long when the export is to end.
constexpr std::chrono::seconds kGrace{3};
/// How often it is looked whether a pipe has been emptied, of which nobody tells: seldom after a while.
constexpr std::chrono::milliseconds kFirstDrainInterval{1};
constexpr std::chrono::milliseconds kLastDrainInterval{200};
/// Writes in a second at a rate, at least.
constexpr std::uint64_t kSlices = 10;

volatile std::sig_atomic_t gIsEnding = 0;

void noteEnd(int /*signal*/) {
    gIsEnding = 1;
}

timespec timeOf(nanoseconds time) {
    const auto seconds = std::chrono::floor<std::chrono::seconds>(time);
    return {.tv_sec = seconds.count(), .tv_nsec = (time - seconds).count()};
}

} // namespace

ExportOutput::ExportOutput(std::uint64_t bytesPerSecond) : bytesPerSecond_(bytesPerSecond) {
    std::signal(SIGPIPE, SIG_IGN);
    sigset_t ends;
    sigemptyset(&ends);
    sigaddset(&ends, SIGINT);
    sigaddset(&ends, SIGTERM);
    ::sigprocmask(SIG_BLOCK, &ends, &before_);
    struct sigaction action {};
    action.sa_handler = noteEnd;
    ::sigaction(SIGINT, &action, nullptr);
    ::sigaction(SIGTERM, &action, nullptr);
}

ExportOutput::~ExportOutput() {
    ::sigprocmask(SIG_SETMASK, &before_, nullptr);
}

bool ExportOutput::isEnding() noexcept {
    // One that is blocked and waits counts as well.
    sigset_t pending;
    return gIsEnding != 0 || (::sigpending(&pending) == 0 &&
                              (sigismember(&pending, SIGINT) == 1 || sigismember(&pending, SIGTERM) == 1));
}

bool ExportOutput::fail(std::string problem) {
    problem_ = std::move(problem);
    return false;
}

int ExportOutput::poll(int descriptor, short events, std::optional<nanoseconds> most) {
    pollfd watched{.fd = descriptor, .events = events, .revents = 0};
    for (;;) {
        auto patience = most;
        if (isEnding()) {
            end_ = end_.value_or(Clock::now() + kGrace);
            patience = std::clamp<nanoseconds>(*end_ - Clock::now(), nanoseconds(0), most.value_or(kGrace));
        }
        const timespec time = timeOf(patience.value_or(nanoseconds(0)));
        const int count = ::ppoll(&watched, 1, patience ? &time : nullptr, &before_);
        if (count >= 0 || errno != EINTR) {
            return count;
        }
    }
}

bool ExportOutput::pace(std::size_t bytes) {
    if (bytesPerSecond_ == 0) {
        return true;
    }
    const auto now = Clock::now();
    if (due_ > now && poll(-1, 0, due_ - now) == 0 && Clock::now() < due_) {
        return fail("ended before all was written");
    }
    const double seconds = static_cast<double>(bytes) / static_cast<double>(bytesPerSecond_);
    due_ = std::max(due_, now) +
           std::chrono::duration_cast<Clock::duration>(std::chrono::duration<double>(seconds));
    return true;
}

bool ExportOutput::write(std::string_view bytes) {
    // A pipe that is ready takes as much without a wait, so that a reader that takes nothing does not keep
    // the export from ending.
    const std::uint64_t slice =
        bytesPerSecond_ == 0 ? PIPE_BUF : std::clamp<std::uint64_t>(bytesPerSecond_ / kSlices, 1, PIPE_BUF);
    while (!bytes.empty()) {
        const std::size_t size = std::min<std::size_t>(bytes.size(), slice);
        if (!pace(size)) {
            return false;
        }
        if (poll(STDOUT_FILENO, POLLOUT, std::nullopt) == 0) {
            return fail("ended before all was written");
        }
        const ssize_t count = ::write(STDOUT_FILENO, bytes.data(), size);
        if (count < 0 && errno != EINTR && errno != EAGAIN) {
            return fail(formatted("cannot write: {}", std::strerror(errno)));
        }
        bytes.remove_prefix(static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
    }
    return true;
}

bool ExportOutput::hasSilentReader() {
    pollfd watched{.fd = STDIN_FILENO, .events = POLLIN, .revents = 0};
    int waiting = 0;
    if (::poll(&watched, 1, 0) == 0 || (::ioctl(STDIN_FILENO, FIONREAD, &waiting) == 0 && waiting == 0 &&
                                        (watched.revents & POLLHUP) == 0)) {
        return true;
    }
    return fail(waiting != 0 ? "the reader acknowledges what it has not been given"
                             : "the reader has closed standard input, on which it acknowledges batches");
}

bool ExportOutput::awaitAcknowledgement() {
    std::array<char, 256> bytes;
    for (;;) {
        if (poll(STDIN_FILENO, POLLIN, std::nullopt) == 0) {
            return fail("ended before the last batch was acknowledged");
        }
        const ssize_t count = ::read(STDIN_FILENO, bytes.data(), bytes.size());
        if (count == 0 || (count < 0 && errno != EINTR && errno != EAGAIN)) {
            return fail("the reader ended before it acknowledged the last batch");
        }
        const auto end = std::next(bytes.begin(), std::max<ssize_t>(count, 0));
        const auto lineEnd = std::find(bytes.begin(), end, '\n');
        if (lineEnd != end) {
            return std::next(lineEnd) == end || fail("the reader acknowledges what it has not been given");
        }
    }
}

bool ExportOutput::wait(int descriptor, std::optional<nanoseconds> most) {
    if (isEnding()) {
        return false;
    }
    // An output that nobody reads any more tells so without being asked for.
    std::array<pollfd, 2> watched{{{.fd = descriptor, .events = POLLIN, .revents = 0},
                                   {.fd = STDOUT_FILENO, .events = 0, .revents = 0}}};
    const timespec time = timeOf(most.value_or(nanoseconds(0)));
    const int count = ::ppoll(watched.data(), watched.size(), most ? &time : nullptr, &before_);
    if (isEnding()) {
        return false;
    }
    return count <= 0 || watched[1].revents == 0 || fail("nobody reads what is exported any more");
}

/// Waits until the reader of a pipe or a socket has taken what is in it: one that ends before has not taken
/// all.
bool ExportOutput::isDrained() {
    struct stat status {};
    (void)::fstat(STDOUT_FILENO, &status);
    const bool isSocket = S_ISSOCK(status.st_mode);
    int waiting = 0;
    auto interval = kFirstDrainInterval;
    while ((isSocket || S_ISFIFO(status.st_mode)) &&
           ::ioctl(STDOUT_FILENO, isSocket ? SIOCOUTQ : FIONREAD, &waiting) == 0 && waiting != 0) {
        if (poll(STDOUT_FILENO, 0, interval) != 0) {
            return fail("the reader ended before it had read all");
        }
        if (end_ && Clock::now() >= *end_) {
            return fail("ended before all was read");
        }
        interval = std::min(2 * interval, kLastDrainInterval);
    }
    // A socket drops what its reader has left.
    return !isSocket || poll(STDOUT_FILENO, 0, nanoseconds(0)) == 0 ||
           fail("the reader ended before it had read all");
}

bool ExportOutput::close() {
    if (!isDrained()) {
        return false;
    }
    const bool isStored = ::fsync(STDOUT_FILENO) == 0 || errno == EINVAL || errno == EROFS;
    return (isStored && ::close(STDOUT_FILENO) == 0) ||
           fail(formatted("cannot write: {}", std::strerror(errno)));
}

} // namespace tamblo::tools
