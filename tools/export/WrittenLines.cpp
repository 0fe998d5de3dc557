#include "tools/export/WrittenLines.h"

#include "base/Format.h"
#include "os/FileDescriptor.h"
#include "platform/CounterFileLayout.h"

#include <algorithm>
#include <cstddef>

#include <fcntl.h>
#include <unistd.h>

namespace tamblo::tools {

namespace {

bool readAt(int descriptor, std::size_t offset, void* place, std::size_t bytes) {
    return ::pread(descriptor, place, bytes, static_cast<off_t>(offset)) == static_cast<ssize_t>(bytes);
}

} // namespace

ServiceCount::ServiceCount(std::string_view runtimeDirectory)
    : path_(formatted("{}/{}", runtimeDirectory, counters::kFileName)) {}

std::optional<WrittenLines> ServiceCount::of(std::string_view sink) const {
    const auto* const known = std::ranges::find(counters::kSinks, sink);
    const FileDescriptor file(::open(path_.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    counters::FileHeader header;
    if (known == counters::kSinks.end() || !file.isOpen() || !readAt(file.get(), 0, &header, sizeof header) ||
        !header.hasMagic() || header.layout != counters::layoutHash()) {
        return std::nullopt;
    }
    const std::size_t slot =
        counters::kFirstSink +
        static_cast<std::size_t>(known - counters::kSinks.begin()) * counters::kCountsOfSink +
        static_cast<std::size_t>(counters::SinkCount::lines);
    WrittenLines written{.began = header.began};
    if (!readAt(file.get(), sizeof header + slot * sizeof written.lines, &written.lines,
                sizeof written.lines)) {
        return std::nullopt;
    }
    return written;
}

} // namespace tamblo::tools
