#include "tools/Terminal.h"

#include "base/NumberText.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <string_view>

#include <poll.h>
#include <sys/ioctl.h>
#include <unistd.h>

namespace tamblo::tools {

namespace {

constexpr std::size_t kUsualLines = 24;
constexpr std::size_t kUsualColumns = 80;
constexpr std::array kEndingSignals{SIGINT, SIGTERM, SIGHUP};

// What a full picture needs of a terminal, as every one since the VT100 knows it.
constexpr std::string_view kHome = "\x1b[H";
constexpr std::string_view kClearLine = "\x1b[K";
constexpr std::string_view kClearBelow = "\x1b[J";
constexpr std::string_view kHideCursor = "\x1b[?25l";
constexpr std::string_view kShowCursor = "\x1b[?25h";

volatile std::sig_atomic_t isSignalled = 0;

void noteSignal(int) {
    isSignalled = 1;
}
void noteNothing(int) {}

void handle(int signal, void (*handler)(int)) {
    struct sigaction action {};
    action.sa_handler = handler; // without SA_RESTART: the wait for a key ends
    ::sigaction(signal, &action, nullptr);
}

std::size_t numberFrom(const char* variable, std::size_t otherwise) {
    const char* const text = std::getenv(variable);
    return text != nullptr ? parseNumber<std::size_t>(text).value_or(otherwise) : otherwise;
}

} // namespace

Terminal::Terminal() : isTerminal_(::isatty(STDOUT_FILENO) == 1) {
    // They come while a key is waited for, and at no other time, so that none is overlooked.
    sigset_t ending;
    sigemptyset(&ending);
    for (const int signal : kEndingSignals) {
        handle(signal, noteSignal);
        sigaddset(&ending, signal);
    }
    ::sigprocmask(SIG_BLOCK, &ending, &whileWaiting_);
    handle(SIGPIPE, noteNothing);
    if (!isTerminal_) {
        return;
    }
    handle(SIGWINCH, noteNothing);
    takesKeys_ = ::isatty(STDIN_FILENO) == 1 && ::tcgetattr(STDIN_FILENO, &before_) == 0;
    if (takesKeys_) {
        termios raw = before_;
        raw.c_lflag &= ~static_cast<tcflag_t>(ICANON | ECHO);
        raw.c_cc[VMIN] = 0;
        raw.c_cc[VTIME] = 0;
        raw.c_cc[VSUSP] = _POSIX_VDISABLE; // a shell would be left with a terminal that echoes nothing
        ::tcsetattr(STDIN_FILENO, TCSANOW, &raw);
    }
    write(kHideCursor);
    write(kHome);
    write(kClearBelow);
}

Terminal::~Terminal() {
    if (isTerminal_) {
        write(kShowCursor);
        write("\n");
    }
    if (takesKeys_) {
        ::tcsetattr(STDIN_FILENO, TCSAFLUSH, &before_);
    }
}

Terminal::Size Terminal::size() const {
    if (!isTerminal_) {
        return {};
    }
    winsize window{};
    // A serial line does not know its size.
    if (::ioctl(STDOUT_FILENO, TIOCGWINSZ, &window) != 0 || window.ws_row == 0 || window.ws_col == 0) {
        return {numberFrom("LINES", kUsualLines), numberFrom("COLUMNS", kUsualColumns)};
    }
    return {window.ws_row, window.ws_col};
}

void Terminal::show(const std::vector<std::string>& lines) const {
    const Size room = size();
    std::string picture(isTerminal_ ? kHome : "");
    // A line end behind the last one would move all of them up.
    const std::size_t shown = isTerminal_ ? std::min(lines.size(), room.lines - 1) : lines.size();
    for (std::size_t i = 0; i != shown; ++i) {
        const std::string_view line = lines[i];
        picture.append(isTerminal_ && line.size() > room.columns && i == 0 ? line.substr(0, room.columns)
                                                                           : line);
        picture.append(isTerminal_ ? kClearLine : "").append(isTerminal_ ? "\r\n" : "\n");
    }
    picture.append(isTerminal_ ? kClearBelow : "");
    write(picture);
}

std::optional<char> Terminal::waitForKey(std::chrono::milliseconds time) {
    if (isEnded()) {
        return std::nullopt;
    }
    pollfd input{.fd = takesKeys_ ? STDIN_FILENO : -1, .events = POLLIN, .revents = 0};
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(time);
    const timespec patience{.tv_sec = seconds.count(),
                            .tv_nsec = std::chrono::nanoseconds(time - seconds).count()};
    if (::ppoll(&input, 1, &patience, &whileWaiting_) <= 0) {
        return std::nullopt;
    }
    char key = 0;
    if (::read(STDIN_FILENO, &key, 1) == 1) {
        return key;
    }
    isGone_ = true;
    return std::nullopt;
}

bool Terminal::isEnded() const noexcept {
    return isSignalled != 0 || isGone_;
}

void Terminal::write(std::string_view text) const {
    while (!text.empty() && !isGone_) {
        const ssize_t count = ::write(STDOUT_FILENO, text.data(), text.size());
        if (count > 0) {
            text.remove_prefix(static_cast<std::size_t>(count));
        } else if (errno != EINTR) {
            isGone_ = true;
        }
    }
}

} // namespace tamblo::tools
