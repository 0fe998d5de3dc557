#include "tools/report/SinkLines.h"

#include "base/Format.h"

#include <algorithm>
#include <cerrno>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tamblo::report {

namespace {

using LineFunction = UniqueFunction<void(std::string_view line)>;

constexpr int kKeptFiles = 4;
constexpr std::size_t kPieceBytes = std::size_t{256} << 10U;

/// Cuts pieces of a file into lines.
class LineCutter {
public:
    LineCutter(ReadCounts& counts, LineFunction& take) : counts_(counts), take_(take) {}

    void add(std::string_view piece) {
        for (std::size_t end = piece.find('\n'); end != std::string_view::npos; end = piece.find('\n')) {
            hold(piece.substr(0, end));
            handOver();
            piece.remove_prefix(end + 1);
        }
        hold(piece);
    }
    void end() {
        if (isTooLong_) {
            ++counts_.longLines;
        } else if (!held_.empty()) {
            ++counts_.tornLines;
        }
    }

private:
    void hold(std::string_view part) {
        if (isTooLong_ || held_.size() + part.size() > kLongestLine) {
            isTooLong_ = true;
            held_.clear();
        } else {
            held_.append(part);
        }
    }
    void handOver() {
        if (isTooLong_) {
            ++counts_.longLines;
        } else {
            ++counts_.lines;
            take_(held_);
        }
        isTooLong_ = false;
        held_.clear();
    }

    ReadCounts& counts_;
    LineFunction& take_;
    std::string held_;
    bool isTooLong_ = false;
};

} // namespace

SinkFiles::SinkFiles(const std::string& directory, std::string_view name, ReadCounts& counts) {
    for (int number = 0; number <= kKeptFiles; ++number) {
        std::string fileName = number == 0 ? std::string(name) : formatted("{}.{}", name, number);
        const std::string path = formatted("{}/{}", directory, fileName);
        struct stat status {};
        // A pipe in a file's place must not be waited for.
        FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
        if (!file.isOpen()) {
            if (errno != ENOENT) {
                counts.unreadable.push_back(std::move(fileName));
            }
            continue;
        }
        if (::fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode)) {
            counts.unreadable.push_back(std::move(fileName));
            continue;
        }
        // A file that was renamed between two openings is met twice and counts once.
        const bool isKnown = std::ranges::any_of(files_, [&status](const File& other) {
            return other.device == status.st_dev && other.inode == status.st_ino;
        });
        if (!isKnown) {
            files_.push_back({std::move(file), status.st_dev, status.st_ino, status.st_size});
        }
    }
    counts.files += files_.size();
}

void SinkFiles::read(ReadCounts& counts, LineFunction& take) const {
    for (auto file = files_.rbegin(); file != files_.rend(); ++file) {
        readFile(*file, counts, take);
    }
}

void SinkFiles::readFile(const File& file, ReadCounts& counts, LineFunction& take) {
    LineCutter lines(counts, take);
    std::string piece(kPieceBytes, '\0');
    // No further than it reached when it was opened: it may grow as fast as it is read.
    for (off_t offset = 0; offset < file.size;) {
        const auto wanted = std::min<off_t>(file.size - offset, static_cast<off_t>(kPieceBytes));
        const ssize_t count =
            ::pread(file.descriptor.get(), piece.data(), static_cast<std::size_t>(wanted), offset);
        if (count <= 0) {
            break;
        }
        lines.add({piece.data(), static_cast<std::size_t>(count)});
        offset += count;
        counts.bytes += static_cast<std::uint64_t>(count);
    }
    lines.end();
}

} // namespace tamblo::report
