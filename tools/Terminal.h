#pragma once

#include <chrono>
#include <csignal>
#include <cstddef>
#include <optional>
#include <string>
#include <vector>

#include <termios.h>

namespace tamblo::tools {

/// The terminal of a command that shows one picture after the other and takes single keys. It is as it was
/// once this goes, which SIGINT, SIGTERM, SIGHUP and a terminal that is gone lead to as well. Needs no more
/// of the terminal than to move to its beginning and to clear a line, so that a serial line will do. One at a
/// time. Where standard output is no terminal, pictures are written one below the other, and no key is read.
class Terminal {
public:
    Terminal();
    ~Terminal();
    Terminal(const Terminal&) = delete;
    Terminal& operator=(const Terminal&) = delete;

    struct Size {
        std::size_t lines = 0; ///< 0: without end
        std::size_t columns = 0;
    };
    [[nodiscard]] Size size() const;
    /// Replaces the picture before; lines that do not fit are left out.
    void show(const std::vector<std::string>& lines) const;
    /// The next key, or nothing when the time is over, the size has changed, or it is to end.
    [[nodiscard]] std::optional<char> waitForKey(std::chrono::milliseconds time);
    /// Whether the command is to end.
    [[nodiscard]] bool isEnded() const noexcept;

private:
    void write(std::string_view text) const;

    bool isTerminal_ = false;
    bool takesKeys_ = false;
    mutable bool isGone_ = false;
    termios before_{};
    sigset_t whileWaiting_{};
};

} // namespace tamblo::tools
