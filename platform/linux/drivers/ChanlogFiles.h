#pragma once

#include "platform/ChanlogFacility.h"
#include "platform/StructuredLog.h"
#include "platform/linux/settings/JsonFile.h"

#include <cstddef>
#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// The channels that drivers publish as files: `*.json` in one directory, each an array of channels.
///
/// A file is read when it has changed; what was read is kept only while the file is certain to be the same.
/// One that is missing, or goes, is no error: its channels are absent. One that cannot be read for another
/// reason keeps its channels. What is wrong with a file is one error line for each state of it, what is wrong
/// with a channel one for as long as it stays wrong; the other files and channels count on. Not thread-safe.
class ChanlogFiles {
public:
    /// A device has a few drivers with some hundred channels; this is far above, and still read in
    /// milliseconds. Files that go beyond are left out, the last ones by name.
    static constexpr std::size_t kMaximumFiles = 256;
    static constexpr std::size_t kMaximumFileSize = 1U << 20U;  ///< bytes
    static constexpr std::size_t kMaximumTotalSize = 4U << 20U; ///< bytes
    /// Of the directory, whatever they are, "." and ".." included. With more, which of them would be looked
    /// at is left to chance, so that none is.
    static constexpr std::size_t kMaximumEntries = 4096;
    /// Lines about channels of one file; the others are counted in one more.
    static constexpr std::size_t kMaximumFaultsTold = 8;

    explicit ChanlogFiles(std::string directory) : directory_(std::move(directory)) {}

    /// Reads what may have changed; whether anything may have.
    [[nodiscard]] bool read(StructuredLog& log);
    /// By the files' names, and in their order in the file.
    void appendTo(std::vector<ChanlogChannelRef>& channels) const;

private:
    struct File {
        JsonFile json;
        std::vector<ChanlogChannelRef> channels = {};
        std::vector<std::string> reportedFaults = {};
    };
    using Files = std::map<std::string, File, std::less<>>;

    [[nodiscard]] bool readFiles(const std::vector<std::string>& names, StructuredLog& log);
    [[nodiscard]] bool readFile(File& file, const FileState& state, StructuredLog& log);
    static void readChannels(File& file, StructuredLog& log);
    /// Once for as long as the same is said.
    void report(StructuredLog& log, std::string_view fault);

    const std::string directory_;
    Files files_;
    ToldOnce told_;
};

} // namespace tamblo
