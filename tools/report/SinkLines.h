#pragma once

#include "base/UniqueFunction.h"
#include "os/FileDescriptor.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include <sys/types.h>

namespace tamblo::report {

/// What was met while sinks were read.
struct ReadCounts {
    std::uint64_t files = 0;
    std::uint64_t bytes = 0;
    std::uint64_t lines = 0;             ///< handed over
    std::uint64_t tornLines = 0;         ///< without an end, at the end of a file
    std::uint64_t longLines = 0;         ///< of more than `kLongestLine`
    std::vector<std::string> unreadable; ///< names of files that could not be opened
};

/// Longer lines are passed over, so that a file without line ends takes no more memory than any other. What a
/// report needs is in lines of some hundred bytes.
inline constexpr std::size_t kLongestLine = std::size_t{1} << 20U;

/// A sink's files, the rotated ones too, as far as they reach when they are opened. All are opened before the
/// first is read: a sink that is rotated meanwhile loses none of its lines.
class SinkFiles {
public:
    SinkFiles(const std::string& directory, std::string_view name, ReadCounts& counts);
    /// Hands over whole lines, those of the oldest file first.
    void read(ReadCounts& counts, UniqueFunction<void(std::string_view line)>& take) const;

private:
    struct File {
        FileDescriptor descriptor;
        dev_t device = 0;
        ino_t inode = 0;
        off_t size = 0;
    };
    static void readFile(const File& file, ReadCounts& counts,
                         UniqueFunction<void(std::string_view line)>& take);

    std::vector<File> files_; ///< the newest first
};

} // namespace tamblo::report
