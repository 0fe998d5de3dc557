#include "tools/records/SinkFile.h"

#include "base/Format.h"
#include "base/Json.h"
#include "tools/records/Payload.h"

#include <algorithm>
#include <array>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tamblo::tools {

namespace {

constexpr std::size_t kPieceBytes = 256 * 1024;

/// Hands over the whole lines from an offset on, and says how many bytes they have.
std::size_t readLines(int descriptor, off_t offset, LineFunction& line) {
    std::string held;
    std::size_t done = 0;
    while (true) {
        const std::size_t before = held.size();
        held.resize(before + kPieceBytes);
        const ssize_t count = ::pread(descriptor, held.data() + before, kPieceBytes,
                                      offset + static_cast<off_t>(done + before));
        held.resize(before + static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
        if (count <= 0) {
            return done;
        }
        std::size_t start = 0;
        for (std::size_t end = held.find('\n', before); end != std::string::npos;
             end = held.find('\n', start)) {
            line(std::string_view(held).substr(start, end - start));
            start = end + 1;
        }
        held.erase(0, start);
        done += start;
    }
}

constexpr std::string_view kEnding = ".jsonl";

constexpr auto kSinks = std::to_array<KnownSink>({
    {"analytics-events", false, "each message, as events"},
    {"power-events", false, "haptics usage"},
    {"diagnostics-metrics", false, "detected issues, as metric records"},
    {"call-quality", true, "each session, its messages and its stop"},
    {"bug-captures", false, "captures of what went wrong (internal builds)"},
    {"bug-report-drafts", false, "bug reports prepared for the user (internal builds)"},
    {"stack-captures", false, "stacks at overloads (internal builds)"},
    {"memory-log", true, "memory of processes"},
});

bool exists(const std::string& path) {
    return ::access(path.c_str(), F_OK) == 0;
}

} // namespace

std::span<const KnownSink> knownSinks() noexcept {
    return kSinks;
}

std::string_view sinkName(std::string_view path) noexcept {
    std::string_view name = path.substr(path.find_last_of('/') + 1);
    if (name.ends_with(kEnding)) {
        name.remove_suffix(kEnding.size());
    }
    return name;
}

const KnownSink* findKnownSink(std::string_view path) noexcept {
    const auto found = std::ranges::find(kSinks, sinkName(path), &KnownSink::name);
    return found == kSinks.end() ? nullptr : &*found;
}

std::string sinkPath(std::string_view logsDirectory, std::string_view typed) {
    std::string path(typed);
    if (typed.find('/') == std::string_view::npos) {
        path.insert(0, std::string(logsDirectory) + "/");
    }
    if (!typed.ends_with(kEnding) && !exists(path)) {
        path += kEnding;
    }
    return path;
}

std::string fileOfSink(const std::string& path, int number) {
    return number == 0 ? path : formatted("{}.{}", path, number);
}

std::vector<std::string> filesOfSink(const std::string& path) {
    std::vector<std::string> files;
    for (int number = kEarlierFiles; number >= 0; --number) {
        if (std::string file = fileOfSink(path, number); exists(file)) {
            files.push_back(std::move(file));
        }
    }
    return files;
}

void SinkFollower::openFile(const std::string& path) {
    struct stat status {};
    file_ = FileDescriptor(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
    if (::fstat(file_.get(), &status) != 0) {
        file_.reset();
        return;
    }
    device_ = status.st_dev;
    inode_ = status.st_ino;
    offset_ = 0;
}

void SinkFollower::skipToEnd() {
    struct stat status {};
    openFile(path_);
    if (file_.isOpen() && ::fstat(file_.get(), &status) == 0) {
        offset_ = status.st_size;
    }
}

void SinkFollower::readNew(LineFunction& line) {
    if (!file_.isOpen()) {
        openFile(path_);
    }
    while (file_.isOpen()) {
        // Asked before reading: once renamed, the file is not written to any more, and what is read is all of
        // it.
        const bool isRenamed = !isFile(path_);
        readToEnd(line);
        if (!isRenamed) {
            return;
        }
        openNext();
    }
}

bool SinkFollower::isFile(const std::string& path) const {
    struct stat status {};
    return ::stat(path.c_str(), &status) == 0 && status.st_dev == device_ && status.st_ino == inode_;
}

void SinkFollower::openNext() {
    int number = kEarlierFiles;
    while (number > 0 && !isFile(fileOfSink(path_, number))) {
        --number;
    }
    // One that is found nowhere was deleted: what is older may have been read, so that the newest comes next.
    const int next = std::max(number - 1, 0);
    openFile(fileOfSink(path_, next));
}

void SinkFollower::readToEnd(LineFunction& line) {
    struct stat status {};
    if (::fstat(file_.get(), &status) == 0 && status.st_size < offset_) {
        offset_ = status.st_size;
    }
    offset_ += static_cast<off_t>(readLines(file_.get(), offset_, line));
}

void readLines(const std::string& path, LineFunction& line) {
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
    (void)readLines(file.get(), 0, line);
}

std::string nameOfRecord(const Dictionary& record) {
    constexpr std::array<std::string_view, 6> keys{"event",  "op",     "captureType",
                                                   "reason", "metric", "reporter"};
    for (const std::string_view key : keys) {
        if (const Value* name = record.find(key)) {
            return name->isString() ? std::string(name->stringValue()) : jsonText(*name);
        }
    }
    return "?";
}

} // namespace tamblo::tools
