#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <ctime>
#include <optional>
#include <string>
#include <string_view>

#include <csignal>

namespace tamblo::tools {

/// The standard output of an export, and the standard input on which its reader says what it has taken.
/// Meanwhile Ctrl-C and SIGTERM do not end the process: nothing more is begun then, and what has been begun
/// is given a little time.
class ExportOutput {
public:
    /// 0 bytes a second are no bound.
    explicit ExportOutput(std::uint64_t bytesPerSecond);
    ~ExportOutput();
    ExportOutput(const ExportOutput&) = delete;
    ExportOutput& operator=(const ExportOutput&) = delete;

    /// Whether somebody asked the export to end.
    [[nodiscard]] static bool isEnding() noexcept;
    /// Writes all of it, no faster than the rate. False, with the reason in `problem`, once nobody reads, or
    /// when the export is to end and nobody reads soon.
    [[nodiscard]] bool write(std::string_view bytes);
    /// Whether the reader has said nothing that it was not asked for; to be called before a batch is written,
    /// as an acknowledgement of what nobody has seen is none.
    [[nodiscard]] bool hasSilentReader();
    /// Waits for a line of the reader, one for each batch. False when none will come.
    [[nodiscard]] bool awaitAcknowledgement();
    /// Waits until there is something to read from the descriptor, or for so long. False at the end; that is
    /// also when the reader has gone, which `problem` says then.
    [[nodiscard]] bool wait(int descriptor, std::optional<std::chrono::nanoseconds> most);
    /// Whether all that was written went where it should, as far as the system says so: to the disk, or
    /// through a pipe to a reader that has taken it out.
    [[nodiscard]] bool close();
    [[nodiscard]] const std::string& problem() const noexcept { return problem_; }

private:
    using Clock = std::chrono::steady_clock;

    /// As `poll` answers; the signals are let in meanwhile, and at no other time. 0 also when the export is
    /// to end and the time for what has been begun is over.
    [[nodiscard]] int poll(int descriptor, short events, std::optional<std::chrono::nanoseconds> most);
    [[nodiscard]] bool pace(std::size_t bytes);
    [[nodiscard]] bool fail(std::string problem);
    [[nodiscard]] bool isDrained();

    const std::uint64_t bytesPerSecond_;
    sigset_t before_{};
    Clock::time_point due_;                ///< when the rate lets the next bytes go
    std::optional<Clock::time_point> end_; ///< of the time that is left for what has been begun
    std::string problem_;
};

} // namespace tamblo::tools
