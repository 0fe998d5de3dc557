#include "platform/linux/log/LinuxStructuredLog.h"

#include "base/Format.h"
#include "base/Utf8.h"
#include "platform/Counters.h"
#include "platform/LogOrigin.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>
#include <source_location>

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>

namespace tamblo {

namespace {

constexpr std::string_view kOwnCategory = "zrrs";
constexpr std::string_view kCut = "…";
constexpr std::string_view kHexDigits = "0123456789abcdef";
/// Of the levels, from debug on.
constexpr std::string_view kPriorities = "76532";

/// One line on the stack: what does not fit is cut off, at a character's end, and leaves a mark.
class LineBuffer {
public:
    void append(std::string_view text) noexcept {
        const std::string_view kept = cutUtf8(text, isCut_ ? 0 : kCapacity - size_);
        isCut_ = kept.size() < text.size() || isCut_;
        std::memcpy(bytes_.data() + size_, kept.data(), kept.size());
        size_ += kept.size();
    }

    void appendHarmless(std::string_view text) noexcept {
        std::size_t clean = 0;
        for (std::size_t at = 0; at < text.size() && !isCut_;) {
            const std::size_t length = controlLength(text, at);
            if (length == 0) {
                ++at;
                continue;
            }
            append(text.substr(clean, at - clean));
            appendEscape(static_cast<unsigned char>(text[at + length - 1]));
            at += length;
            clean = at;
        }
        append(text.substr(clean));
    }

    [[nodiscard]] std::string_view finish() noexcept {
        if (isCut_) {
            std::memcpy(bytes_.data() + size_, kCut.data(), kCut.size());
            size_ += kCut.size();
        }
        bytes_[size_++] = '\n';
        return {bytes_.data(), size_};
    }

private:
    static constexpr std::size_t kCapacity = LinuxStructuredLog::kMaximumLine - kCut.size() - 1;

    void appendEscape(unsigned char character) noexcept {
        switch (character) {
        case '\n':
            return append("\\n");
        case '\r':
            return append("\\r");
        case '\t':
            return append("\\t");
        default:
            const std::array<char, 4> escape{'\\', 'x', kHexDigits[character >> 4U],
                                             kHexDigits[character & 0xFU]};
            return append({escape.data(), escape.size()});
        }
    }

    std::array<char, LinuxStructuredLog::kMaximumLine> bytes_;
    std::size_t size_ = 0;
    bool isCut_ = false;
};

bool isWritable(int descriptor) noexcept {
    pollfd question{descriptor, POLLOUT, 0};
    return ::poll(&question, 1, 0) == 1 && (question.revents & POLLOUT) != 0;
}

const char* variableOrEmpty(const char* name) {
    const char* value = std::getenv(name);
    return value != nullptr ? value : "";
}

} // namespace

LinuxStructuredLog::LinuxStructuredLog() : LinuxStructuredLog(STDERR_FILENO, variableOrEmpty("TAMBLO_LOG")) {}

LinuxStructuredLog::LinuxStructuredLog(int descriptor, std::string_view filter)
    : filter_(filter), descriptor_(descriptor) {
    std::signal(SIGPIPE, SIG_IGN);
    prepareChannel(descriptor);
    for (const std::string& word : filter_.unknownWords()) {
        report(LogLevel::error, kOwnCategory,
               formatted("TAMBLO_LOG: \"{}\" is neither a level (debug, info, default, error, fault) nor "
                         "CODE=level with a code that there is (\"tambloctl list log-codes\"); it is ignored",
                         word));
    }
}

LinuxStructuredLog::~LinuxStructuredLog() {
    tellLeftOut(LogLimiter::Time::max());
    static_cast<void>(reportDropped());
}

/// The description behind standard error may be shared with other processes, which must not find it
/// non-blocking all at once; a pipe or a terminal is opened once more, for a description of our own.
void LinuxStructuredLog::prepareChannel(int descriptor) {
    struct stat status {};
    if (::fstat(descriptor, &status) != 0) {
        const int nothing = ::open("/dev/null", O_WRONLY | O_CLOEXEC);
        if (nothing >= 0 && nothing != descriptor) {
            ::dup2(nothing, descriptor);
            ::close(nothing);
        }
        return;
    }
    if (S_ISSOCK(status.st_mode)) {
        channel_ = Channel::socket;
        return;
    }
    if (!S_ISFIFO(status.st_mode) && !S_ISCHR(status.st_mode)) {
        return;
    }
    own_ = FileDescriptor(::open(formatted("/proc/self/fd/{}", descriptor).c_str(),
                                 O_WRONLY | O_APPEND | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    if (own_.isOpen()) {
        descriptor_ = own_.get();
    } else {
        channel_ = Channel::askFirst;
    }
}

LogLevel LinuxStructuredLog::threshold(std::string_view categoryCode) const noexcept {
    return filter_.threshold(categoryCode);
}

bool LinuxStructuredLog::admits(const LogKind& kind) noexcept {
    const std::optional<ClientIdentity> client = LogOrigin::client();
    if (!client || filter_.threshold(kind.categoryCode) < LogLevel::standard ||
        limiter_.admits(*client, kind, std::chrono::steady_clock::now())) {
        return true;
    }
    counters::add(counters::Counter::logLinesRate);
    return false;
}

void LinuxStructuredLog::write(LogLevel level, std::string_view categoryCode,
                               std::string_view line) noexcept {
    if (limiter_.hasLeftOut()) {
        tellLeftOut(std::chrono::steady_clock::now());
    }
    writeLine(level, categoryCode, line);
}

void LinuxStructuredLog::tellLeftOut(LogLimiter::Time now) noexcept {
    while (const std::optional<LogLimiter::LeftOut> leftOut = limiter_.takeLeftOut(now)) {
        const LogKind& kind = leftOut->kind;
        try {
            std::string line;
            appendLinePrefix(line, kind.place);
            appendFormatted(line, "{} further lines like \"{}\" were left out. uid={} pid={}", leftOut->lines,
                            kind.format, leftOut->last.user, leftOut->last.process);
            writeLine(kind.level, kind.categoryCode, line);
        } catch (const std::bad_alloc&) {
            dropped_.fetch_add(1, std::memory_order_relaxed);
        }
    }
}

void LinuxStructuredLog::writeLine(LogLevel level, std::string_view categoryCode,
                                   std::string_view line) noexcept {
    LineBuffer buffer;
    const std::array<char, 3> prefix{'<', kPriorities[static_cast<std::size_t>(level)], '>'};
    buffer.append({prefix.data(), prefix.size()});
    buffer.appendHarmless(categoryCode);
    buffer.append(" ");
    buffer.appendHarmless(line);
    const std::string_view bytes = buffer.finish();
    lastLines_.add(bytes);
    if (level >= LogLevel::error) {
        lastErrors_.add(std::chrono::system_clock::now(), categoryCode, line);
    }
    if (!reportDropped() || !put(bytes)) {
        counters::add(counters::Counter::logLinesUnread);
        dropped_.fetch_add(1, std::memory_order_relaxed);
    }
}

bool LinuxStructuredLog::reportDropped() noexcept {
    const std::uint64_t dropped = dropped_.exchange(0, std::memory_order_relaxed);
    if (dropped == 0 || filter_.threshold(kOwnCategory) > LogLevel::error) {
        return true;
    }
    std::array<char, 128> text;
    const int length =
        std::snprintf(text.data(), text.size(), "<3>zrrs %25s:%-5u %llu log lines were dropped here\n",
                      "LinuxStructuredLog", static_cast<unsigned>(std::source_location::current().line()),
                      static_cast<unsigned long long>(dropped));
    if (put({text.data(), static_cast<std::size_t>(length)})) {
        return true;
    }
    dropped_.fetch_add(dropped, std::memory_order_relaxed);
    return false;
}

bool LinuxStructuredLog::put(std::string_view bytes) noexcept {
    // What follows half a line begins on a line of its own.
    if (isTorn_.exchange(false, std::memory_order_relaxed) && !put("\n")) {
        isTorn_.store(true, std::memory_order_relaxed);
        return false;
    }
    std::size_t written = 0;
    while (written < bytes.size()) {
        const ssize_t count = putSome(bytes.substr(written));
        if (count <= 0) {
            break;
        }
        written += static_cast<std::size_t>(count);
    }
    if (written != 0 && written < bytes.size()) {
        isTorn_.store(true, std::memory_order_relaxed);
    }
    return written == bytes.size();
}

ssize_t LinuxStructuredLog::putSome(std::string_view bytes) noexcept {
    ssize_t count = 0;
    do {
        switch (channel_) {
        case Channel::socket:
            count = ::send(descriptor_, bytes.data(), bytes.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
            break;
        case Channel::askFirst:
            if (!isWritable(descriptor_)) {
                return 0;
            }
            // A pipe that is ready takes this much at once.
            count = ::write(descriptor_, bytes.data(), std::min<std::size_t>(bytes.size(), PIPE_BUF));
            break;
        case Channel::plain:
            count = ::write(descriptor_, bytes.data(), bytes.size());
            break;
        }
    } while (count < 0 && errno == EINTR);
    return count;
}

} // namespace tamblo
