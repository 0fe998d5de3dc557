#include "tools/records/SinkSnapshot.h"

#include "base/Format.h"
#include "tools/records/AccessFault.h"
#include "tools/records/SinkFile.h"

#include <algorithm>
#include <cerrno>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tamblo::tools {

namespace {

constexpr std::size_t kPieceBytes = 256U << 10U;
/// The service's own have 16 MiB at most.
constexpr std::size_t kLongestLine = 32U << 20U;

} // namespace

SinkSnapshot::SinkSnapshot(const std::string& path) {
    // The newest first: what is renamed meanwhile is then met again, and not missed.
    for (int number = 0; number <= kEarlierFiles; ++number) {
        open(fileOfSink(path, number));
    }
    std::ranges::reverse(files_);
}

void SinkSnapshot::open(const std::string& path) {
    struct stat status {};
    FileDescriptor descriptor(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    if (!descriptor.isOpen() || ::fstat(descriptor.get(), &status) != 0) {
        if (const int fault = errno; fault != ENOENT && problem_.empty()) {
            problem_ = formatted("cannot read {}: {}", path, describeFault(fault, path));
        }
        return;
    }
    const bool isKnown = std::ranges::any_of(files_, [&status](const File& file) {
        return file.device == status.st_dev && file.inode == status.st_ino;
    });
    if (!isKnown && S_ISREG(status.st_mode)) {
        files_.push_back({std::move(descriptor), status.st_size, status.st_dev, status.st_ino});
    }
}

void SinkSnapshot::read(Place from, LineFunction& line) {
    passedOver_ = 0;
    while (from.file < files_.size() && readFile(from, line)) {
        from = {.file = from.file + 1};
    }
}

bool SinkSnapshot::readFile(Place from, LineFunction& line) {
    const File& file = files_[from.file];
    std::string held;
    bool isTooLong = false;
    off_t begin = from.offset; // of what is held
    for (;;) {
        const std::size_t before = held.size();
        const off_t left = file.size - begin - static_cast<off_t>(before);
        const std::size_t wanted = std::min(kPieceBytes, static_cast<std::size_t>(std::max<off_t>(left, 0)));
        held.resize(before + wanted);
        const ssize_t count =
            ::pread(file.descriptor.get(), held.data() + before, wanted, begin + static_cast<off_t>(before));
        held.resize(before + static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
        if (count <= 0) {
            passedOver_ += held.empty() && !isTooLong ? 0 : 1;
            return true;
        }
        std::size_t start = 0;
        for (std::size_t end = held.find('\n', before); end != std::string::npos;
             end = held.find('\n', start)) {
            if (std::exchange(isTooLong, false)) {
                ++passedOver_;
            } else if (!line(std::string_view(held).substr(start, end - start),
                             {from.file, begin + static_cast<off_t>(start)})) {
                return false;
            }
            start = end + 1;
        }
        isTooLong = isTooLong || held.size() - start > kLongestLine;
        start = isTooLong ? held.size() : start;
        held.erase(0, start);
        begin += static_cast<off_t>(start);
    }
}

} // namespace tamblo::tools
