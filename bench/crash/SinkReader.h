#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <string_view>

#include <sys/types.h>

namespace tamblo::bench {

enum class Sink : std::uint8_t { analyticsEvents, powerEvents };

/// Whose record a line is of.
struct SinkRecord {
    std::size_t client = 0;
    std::uint64_t number = 0;
};

/// Reads a sink's files from the oldest to the newest, each line once, however often they are renamed. Files
/// that the service has done with are removed when they have been read, so that it never has to.
class SinkReader {
public:
    SinkReader(const std::string& logsDirectory, Sink sink);

    /// While nobody writes, and the last line is not to be cut off any more.
    void read(const std::function<void(const SinkRecord&)>& found);

    [[nodiscard]] const std::string& path() const noexcept { return path_; }
    /// Whether the newest file ends within a line; it is right after a kill that one can.
    [[nodiscard]] bool isTorn() const;
    /// How many lines were none that the service writes, or had no line end.
    [[nodiscard]] std::uint64_t brokenLines() const noexcept { return broken_; }
    /// How often the service has begun a new file.
    [[nodiscard]] std::uint64_t rotations() const noexcept { return rotations_; }

private:
    void readFile(const std::string& path, const std::function<void(const SinkRecord&)>& found);
    void readLine(std::string_view line, const std::function<void(const SinkRecord&)>& found);

    const std::string path_;
    const Sink sink_;
    std::map<ino_t, off_t> readTo_;
    std::uint64_t broken_ = 0;
    std::uint64_t rotations_ = 0;
};

} // namespace tamblo::bench
