#pragma once

#include "base/UniqueFunction.h"
#include "os/FileDescriptor.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include <sys/types.h>

namespace tamblo::tools {

/// A sink's files as they stand at one moment, the oldest first. All are held open, so that the sink may
/// rename and remove them while they are read; what is written from then on does not belong to them. Memory
/// is bounded by the longest line that the service writes.
class SinkSnapshot {
public:
    /// Where a line begins.
    struct Place {
        std::size_t file = 0;
        off_t offset = 0;
    };
    /// Whether to go on.
    using LineFunction = UniqueFunction<bool(std::string_view line, Place place)>;

    explicit SinkSnapshot(const std::string& path);

    [[nodiscard]] bool isEmpty() const noexcept { return files_.empty(); }
    /// Why a file that is there could not be opened; empty when all were.
    [[nodiscard]] const std::string& problem() const noexcept { return problem_; }
    /// Hands over every whole line from the place on.
    void read(Place from, LineFunction& line);
    /// What the last reading passed over: lines that are longer than any that the service writes, and ends
    /// of files that are no whole lines.
    [[nodiscard]] std::uint64_t passedOver() const noexcept { return passedOver_; }

private:
    struct File {
        FileDescriptor descriptor;
        off_t size = 0;
        dev_t device = 0;
        ino_t inode = 0;
    };

    void open(const std::string& path);
    [[nodiscard]] bool readFile(Place from, LineFunction& line);

    std::vector<File> files_;
    std::string problem_;
    std::uint64_t passedOver_ = 0;
};

} // namespace tamblo::tools
