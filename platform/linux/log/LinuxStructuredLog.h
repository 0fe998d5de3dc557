#pragma once

#include "os/FileDescriptor.h"
#include "platform/StructuredLog.h"
#include "platform/linux/log/LastErrors.h"
#include "platform/linux/log/LogFilter.h"
#include "platform/linux/log/LogLimiter.h"
#include "platform/linux/log/LogRing.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include <sys/types.h>

namespace tamblo {

/// The log on standard error, one line per record: `<P>CODE TEXT`, P the sd-daemon priority.
///
/// A record is one write, of at most `kMaximumLine` bytes. What a client can put into a text cannot make a
/// line of its own or reach a terminal: control characters are written as escapes. A reader that is slow or
/// gone neither holds up the service nor ends it: what cannot be written at once is dropped, and the next
/// line that can be is preceded by one that says how many were. The last lines are remembered, those that
/// were dropped among them.
///
/// What clients may cause is limited (`LogLimiter`), in categories of which no more is asked for than the
/// default level: who asks for `info` or `debug` is looking for something, and gets all. How much was left
/// out is told before the next line of anybody, once the second is over, or at the end. Any thread; the only
/// locks are those in which a line is counted and remembered.
class LinuxStructuredLog final : public StructuredLog {
public:
    static constexpr std::size_t kMaximumLine = 8192;

    /// The log of this process: standard error, filtered by `TAMBLO_LOG`.
    LinuxStructuredLog();
    /// The descriptor is borrowed. When it is closed, it is opened on nothing, lest the next file that the
    /// service opens take its number and be given the log. SIGPIPE is ignored from here on, in the whole
    /// process.
    LinuxStructuredLog(int descriptor, std::string_view filter);
    ~LinuxStructuredLog() override;
    LinuxStructuredLog(const LinuxStructuredLog&) = delete;
    LinuxStructuredLog& operator=(const LinuxStructuredLog&) = delete;

    [[nodiscard]] LogLevel threshold(std::string_view categoryCode) const noexcept override;
    [[nodiscard]] bool admits(const LogKind& kind) noexcept override;
    void write(LogLevel level, std::string_view categoryCode, std::string_view line) noexcept override;
    /// The last lines, as they are written to standard error.
    [[nodiscard]] std::string lastLines() const { return lastLines_.text(); }
    [[nodiscard]] const LastErrors& lastErrors() const noexcept { return lastErrors_; }

private:
    /// How to write without waiting.
    enum class Channel : std::uint8_t {
        plain,    ///< a file, or a description of our own that does not block
        socket,   ///< per call
        askFirst, ///< a pipe or terminal that is shared with others and may not be changed
    };

    void prepareChannel(int descriptor);
    void tellLeftOut(LogLimiter::Time now) noexcept;
    void writeLine(LogLevel level, std::string_view categoryCode, std::string_view line) noexcept;
    [[nodiscard]] bool put(std::string_view bytes) noexcept;
    [[nodiscard]] ssize_t putSome(std::string_view bytes) noexcept;
    [[nodiscard]] bool reportDropped() noexcept;

    LogFilter filter_;
    LogLimiter limiter_;
    LogRing lastLines_;
    LastErrors lastErrors_;
    int descriptor_;
    FileDescriptor own_;
    Channel channel_ = Channel::plain;
    std::atomic<std::uint64_t> dropped_{0};
    std::atomic<bool> isTorn_{false};
};

} // namespace tamblo
