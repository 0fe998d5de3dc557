#pragma once

#include "os/FileDescriptor.h"
#include "tools/export/Progress.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include <sys/types.h>

namespace tamblo::tools {

/// Which of what is left is exported next.
enum class Order { oldestFirst, newestFirst };

/// Lines of a sink that stand one behind the other in one file, in the order of the file.
struct Piece {
    std::string identity; ///< of the file
    Range range;
    std::string text;        ///< whole lines; empty of a line that is longer than `kLongestLine`
    std::uint64_t lines = 0; ///< among them the longer one
    [[nodiscard]] bool isTooLong() const noexcept { return text.empty() && lines != 0; }
};

/// What is known of lines that were removed with their files before they were exported.
struct MissedLines {
    std::uint64_t known = 0; ///< that had been counted
    /// The file that was written to last is gone, too: what was written between these times, in seconds since
    /// 1970, may have been lost with it, and nobody counted it. The later one is 0 where no line is left.
    struct Span {
        std::int64_t from = 0;
        std::int64_t to = 0;
    };
    std::optional<Span> uncounted = std::nullopt;

    [[nodiscard]] bool isEmpty() const noexcept { return known == 0 && !uncounted; }
};

/// What stands in the files of a sink, its earlier ones among them, and has not been exported yet.
///
/// A file is known by its first line, which has the time at which it was written: so it is the same file
/// under each of the names that it is given, and on another disk. Only whole lines count. Memory is bounded,
/// whatever the size of the files and lines. The files of the last look are held open: what is removed
/// meanwhile can be read until the next one.
class SinkBacklog {
public:
    /// Bytes of a piece, unless one line has more; and of a line that is exported at all.
    static constexpr std::size_t kPieceBytes = 256U << 10U;
    static constexpr std::size_t kLongestLine = 1U << 20U;

    SinkBacklog(std::string path, SinkProgress progress)
        : path_(std::move(path)), progress_(std::move(progress)) {}

    /// Looks which files there are, and counts what has been written to them.
    [[nodiscard]] MissedLines look();
    /// Of what is left, up to so many lines; none has no lines. What was handed over and not taken is handed
    /// over again.
    [[nodiscard]] Piece next(Order order, std::uint64_t mostLines) const;
    void take(const Piece& piece);
    [[nodiscard]] SinkProgress progress() const;
    /// Lines that are left.
    [[nodiscard]] std::uint64_t leftLines() const;
    /// Lines that the last look counted for the first time.
    [[nodiscard]] std::uint64_t newLines() const noexcept { return newLines_; }
    /// Which files could not be read at the last look, and why.
    [[nodiscard]] const std::vector<std::string>& problems() const noexcept { return problems_; }

private:
    struct File {
        std::string path;
        FileDescriptor descriptor;
        std::uint64_t size = 0;
        std::int64_t written = 0;
        dev_t device = 0;
        ino_t inode = 0;
        std::string identity = {};
    };

    [[nodiscard]] std::vector<File> openFiles();
    void open(const std::string& path, std::vector<File>& files);
    void identify(File& file) const;
    void leaveOutCopies(std::vector<File>& files);

    std::string path_;
    SinkProgress progress_;
    SinkProgress unseen_;     ///< of files that may be among those that could not be read
    std::vector<File> files_; ///< of the last look; the oldest first, and each with its progress
    std::vector<std::string> problems_;
    std::uint64_t newLines_ = 0;
};

} // namespace tamblo::tools
