#pragma once

#include "base/Dictionary.h"
#include "base/UniqueFunction.h"
#include "os/FileDescriptor.h"

#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include <sys/types.h>

namespace tamblo::tools {

/// A report sink of the service.
struct KnownSink {
    std::string_view name;
    bool namesReporter; ///< in its lines, or in those that open a session
    std::string_view what;
};
[[nodiscard]] std::span<const KnownSink> knownSinks() noexcept;
/// What a sink is called: its file's name without directory and ending.
[[nodiscard]] std::string_view sinkName(std::string_view path) noexcept;
/// By the path or the name of its file, with or without the ending; null for a file of another name.
[[nodiscard]] const KnownSink* findKnownSink(std::string_view path) noexcept;

/// The path of a report sink from what was typed: a name with or without its ending, or a path.
[[nodiscard]] std::string sinkPath(std::string_view logsDirectory, std::string_view typed);

/// The files that the service keeps of a sink besides the one that it writes to.
inline constexpr int kEarlierFiles = 4;
/// The path of a sink's file by its age: of 0 it is the one that is written to, of 1 the one before.
[[nodiscard]] std::string fileOfSink(const std::string& path, int number);
/// The sink's files that exist, the oldest first: NAME.4 … NAME.1, NAME.
[[nodiscard]] std::vector<std::string> filesOfSink(const std::string& path);

using LineFunction = UniqueFunction<void(std::string_view line)>;

/// Reads the lines of a sink's file as they are written, and goes on with the next file when the sink has
/// renamed the one that it reads. A line counts once its end has been written; one that is cut off again
/// never shows.
class SinkFollower {
public:
    explicit SinkFollower(std::string path) : path_(std::move(path)) {}

    /// Passes over what stands in the file now, without reading it. The next line handed over may be the rest
    /// of one that was just being written.
    void skipToEnd();
    /// Hands over every line that has come since the last call, in the file that stands there now at the
    /// first, and follows renames.
    void readNew(LineFunction& line);

private:
    void readToEnd(LineFunction& line);
    void openFile(const std::string& path);
    void openNext();
    [[nodiscard]] bool isFile(const std::string& path) const;

    const std::string path_;
    FileDescriptor file_;
    off_t offset_ = 0; ///< behind the last whole line
    dev_t device_ = 0;
    ino_t inode_ = 0;
};

/// Hands over every whole line of a file.
void readLines(const std::string& path, LineFunction& line);

/// What a line counts as: its event, or, in a sink without events, what comes nearest.
[[nodiscard]] std::string nameOfRecord(const Dictionary& record);

} // namespace tamblo::tools
