#include "tools/export/WrittenLines.h"

#include "os/FileDescriptor.h"
#include "platform/Counters.h"

#include <algorithm>
#include <array>
#include <cstddef>

#include <fcntl.h>
#include <unistd.h>

namespace tamblo::tools {

namespace {

constexpr std::uint64_t kMagic = 0x31'23'6F'6C'62'6D'61'74; ///< "tamblo#1"
constexpr std::size_t kHeaderBytes = 64;

bool readAt(int descriptor, std::size_t offset, void* numbers, std::size_t bytes) {
    return ::pread(descriptor, numbers, bytes, static_cast<off_t>(offset)) == static_cast<ssize_t>(bytes);
}

} // namespace

std::optional<WrittenLines> ServiceCount::of(std::string_view sink) const {
    const auto* const known = std::ranges::find(counters::kSinks, sink);
    const FileDescriptor file(::open(path_.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    std::array<std::uint64_t, 3> header{}; // the magic number, the layout, and the beginning
    if (known == counters::kSinks.end() || !file.isOpen() ||
        !readAt(file.get(), 0, header.data(), sizeof header) || header[0] != kMagic ||
        header[1] != counters::layoutHash()) {
        return std::nullopt;
    }
    const std::size_t slot =
        counters::kFirstSink +
        static_cast<std::size_t>(known - counters::kSinks.begin()) * counters::kCountsOfSink +
        static_cast<std::size_t>(counters::SinkCount::lines);
    WrittenLines written{.began = header[2]};
    if (!readAt(file.get(), kHeaderBytes + slot * sizeof written.lines, &written.lines,
                sizeof written.lines)) {
        return std::nullopt;
    }
    return written;
}

} // namespace tamblo::tools
