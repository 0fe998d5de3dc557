#include "tools/export/SinkBacklog.h"

#include "base/Format.h"
#include "base/Sha256.h"
#include "base/Value.h"
#include "tools/records/AccessFault.h"
#include "tools/records/SinkFile.h"

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <optional>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tamblo::tools {

namespace {

/// Files that the cursor remembers while others cannot be read.
constexpr std::size_t kMostUnseen = 8;
constexpr std::size_t kReadBytes = 128U << 10U;
/// Of the first line, for the identity.
constexpr std::size_t kIdentityBytes = 4096;
constexpr std::size_t kTailBytes = 64;
constexpr std::size_t kIdentityDigits = 16;

/// What stands there, as far as there is something.
std::string readAt(int descriptor, std::uint64_t offset, std::size_t count) {
    std::string bytes(count, '\0');
    std::size_t done = 0;
    while (done != count) {
        const ssize_t read =
            ::pread(descriptor, bytes.data() + done, count - done, static_cast<off_t>(offset + done));
        if (read < 0 && errno == EINTR) {
            continue;
        }
        if (read <= 0) {
            break;
        }
        done += static_cast<std::size_t>(read);
    }
    bytes.resize(done);
    return bytes;
}

/// Behind the first line end in a range of the file; nothing without one.
std::optional<std::uint64_t> behindFirstLine(int descriptor, Range range) {
    for (std::uint64_t at = range.begin; at < range.end; at += kReadBytes) {
        const std::string bytes = readAt(descriptor, at, std::min<std::uint64_t>(kReadBytes, range.end - at));
        if (const std::size_t found = bytes.find('\n'); found != std::string::npos) {
            return at + found + 1;
        }
    }
    return std::nullopt;
}

/// Where the last line of a range of whole lines begins.
std::uint64_t beginOfLastLine(int descriptor, Range range) {
    for (std::uint64_t end = range.end - 1; end > range.begin;) {
        const std::uint64_t begin = std::max(range.begin, end - std::min<std::uint64_t>(end, kReadBytes));
        const std::string bytes = readAt(descriptor, begin, end - begin);
        if (const std::size_t found = bytes.rfind('\n'); found != std::string::npos) {
            return begin + found + 1;
        }
        end = begin;
    }
    return range.begin;
}

/// A hash of the last bytes in front of an offset.
std::string tailOf(int descriptor, std::uint64_t end) {
    const std::uint64_t begin = end - std::min<std::uint64_t>(end, kTailBytes);
    return sha256(readAt(descriptor, begin, end - begin)).substr(0, kIdentityDigits);
}

/// Counts the lines that have been written since the last time. A file whose end was lost in a power cut, or
/// cut off by somebody, may have got other lines in its place: it is read anew.
void count(int descriptor, std::uint64_t size, FileProgress& file) {
    if (size < file.counted || (file.counted != 0 && tailOf(descriptor, file.counted) != file.tail)) {
        file = {.identity = file.identity, .tail = {}, .taken = {}};
    }
    const std::uint64_t before = file.counted;
    for (std::uint64_t at = file.counted; at < size; at += kReadBytes) {
        const std::string bytes = readAt(descriptor, at, std::min<std::uint64_t>(kReadBytes, size - at));
        if (const std::size_t last = bytes.rfind('\n'); last != std::string::npos) {
            file.lines += static_cast<std::uint64_t>(std::ranges::count(bytes, '\n'));
            file.counted = at + last + 1;
        }
    }
    if (file.counted != before) {
        file.tail = tailOf(descriptor, file.counted);
    }
}

/// Of the first line, once it is whole, or of as much of it as tells it from others.
std::string identityOf(int descriptor) {
    std::string first = readAt(descriptor, 0, kIdentityBytes);
    const std::size_t end = first.find('\n');
    if (end == std::string::npos && first.size() != kIdentityBytes) {
        return {};
    }
    first.resize(std::min(end, first.size()));
    return sha256(first).substr(0, kIdentityDigits);
}

/// The time of a file's first line, in seconds since 1970; 0 where it has none.
std::int64_t timeOfFirstLine(int descriptor) {
    constexpr std::string_view kTime = "{\"time\":";
    const std::string first = readAt(descriptor, 0, kTailBytes);
    return first.starts_with(kTime) ? Value(first.substr(kTime.size())).integerValue() : 0;
}

/// Where `lines` lines from the front, or from the end, of whole lines end or begin.
std::size_t behindLines(std::string_view text, std::uint64_t lines) {
    std::size_t at = 0;
    for (std::uint64_t i = 0; i != lines && at != text.size(); ++i) {
        at = text.find('\n', at) + 1;
    }
    return at;
}

std::size_t beginOfLines(std::string_view text, std::uint64_t lines) {
    std::size_t at = text.size();
    for (std::uint64_t i = 0; i != lines && at != 0; ++i) {
        const std::size_t before = at < 2 ? std::string_view::npos : text.rfind('\n', at - 2);
        at = before == std::string_view::npos ? 0 : before + 1;
    }
    return at;
}

Piece makePiece(std::string identity, Range range, std::string text) {
    const auto lines = static_cast<std::uint64_t>(std::ranges::count(text, '\n'));
    return {std::move(identity), range, std::move(text), lines};
}

/// What stands in the range, whose end was that of a line; nothing where that has been cut off, or something
/// else stands in its place, since the file was looked at.
std::string readToLineEnd(int descriptor, Range range) {
    std::string text = readAt(descriptor, range.begin, range.end - range.begin);
    const bool isWhole = text.size() == range.end - range.begin && text.ends_with('\n');
    return isWhole ? text : std::string();
}

/// One line, which is longer than a piece.
Piece lineAsPiece(int descriptor, std::string identity, Range line) {
    const bool isTooLong = line.end - line.begin > SinkBacklog::kLongestLine;
    std::string text = isTooLong ? std::string() : readToLineEnd(descriptor, line);
    const bool isGone = !isTooLong && text.empty();
    return isGone ? Piece{} : Piece{std::move(identity), line, std::move(text), 1};
}

Piece firstOf(int descriptor, const FileProgress& file, std::uint64_t mostLines) {
    const Range left = file.firstLeft();
    std::string text = readAt(descriptor, left.begin,
                              std::min<std::uint64_t>(SinkBacklog::kPieceBytes, left.end - left.begin));
    text.resize(text.rfind('\n') + 1);
    if (text.empty()) {
        const auto end = behindFirstLine(descriptor, left);
        return end ? lineAsPiece(descriptor, file.identity, {left.begin, *end}) : Piece{};
    }
    text.resize(behindLines(text, mostLines));
    const std::uint64_t size = text.size();
    return makePiece(file.identity, {left.begin, left.begin + size}, std::move(text));
}

Piece lastOf(int descriptor, const FileProgress& file, std::uint64_t mostLines) {
    const Range left = file.lastLeft();
    const std::uint64_t begin =
        std::max(left.begin, left.end - std::min<std::uint64_t>(left.end, SinkBacklog::kPieceBytes));
    std::string text = readToLineEnd(descriptor, {begin, left.end});
    if (text.empty()) {
        return {};
    }
    if (begin != left.begin) {
        // It begins in the middle of a line, most likely.
        text.erase(0, text.find('\n') + 1);
    }
    if (text.empty()) {
        const Range line{beginOfLastLine(descriptor, left), left.end};
        return line.begin < line.end ? lineAsPiece(descriptor, file.identity, line) : Piece{};
    }
    text.erase(0, beginOfLines(text, mostLines));
    const std::uint64_t size = text.size();
    return makePiece(file.identity, {left.end - size, left.end}, std::move(text));
}

} // namespace

std::vector<SinkBacklog::File> SinkBacklog::openFiles() {
    std::vector<File> files;
    problems_.clear();
    // The newest first: what is renamed meanwhile is then met again, and not missed.
    for (int number = 0; number <= kEarlierFiles; ++number) {
        open(fileOfSink(path_, number), files);
    }
    std::ranges::reverse(files);
    return files;
}

void SinkBacklog::open(const std::string& path, std::vector<File>& files) {
    struct stat status {};
    FileDescriptor descriptor(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    if (!descriptor.isOpen() || ::fstat(descriptor.get(), &status) != 0) {
        if (const int fault = errno; fault != ENOENT) {
            problems_.push_back(formatted("cannot read {}: {}", path, describeFault(fault, path)));
        }
        return;
    }
    if (!S_ISREG(status.st_mode)) {
        problems_.push_back(formatted("cannot read {}: it is no file", path));
        return;
    }
    const bool isKnown = std::ranges::any_of(files, [&status](const File& file) {
        return file.device == status.st_dev && file.inode == status.st_ino;
    });
    if (!isKnown) {
        files.push_back({.path = path,
                         .descriptor = std::move(descriptor),
                         .size = static_cast<std::uint64_t>(status.st_size),
                         .written = status.st_mtim.tv_sec,
                         .device = status.st_dev,
                         .inode = status.st_ino});
    }
}

void SinkBacklog::identify(File& file) const {
    // No other file gets the inode of one that is held open.
    const auto held = std::ranges::find_if(files_, [&file](const File& other) {
        return other.device == file.device && other.inode == file.inode && other.size <= file.size;
    });
    file.identity = held != files_.end() ? held->identity : identityOf(file.descriptor.get());
}

/// Of files that begin alike, the longest stays: it is the one that is written to.
void SinkBacklog::leaveOutCopies(std::vector<File>& files) {
    for (File& file : files) {
        const bool isCopy = std::ranges::any_of(files, [&file](const File& other) {
            return other.identity == file.identity &&
                   (other.size > file.size || (other.size == file.size && &other < &file));
        });
        if (isCopy && !file.identity.empty()) {
            problems_.push_back(
                formatted("{} begins like another file of its sink, and is left out", file.path));
            file.identity.clear();
        }
    }
}

MissedLines SinkBacklog::look() {
    std::vector<File> files = openFiles();
    SinkProgress before = std::move(unseen_);
    std::ranges::move(progress_, std::back_inserter(before));
    const std::string newest = before.empty() ? std::string() : before.back().identity;
    SinkProgress now;
    newLines_ = 0;
    for (File& file : files) {
        identify(file);
    }
    leaveOutCopies(files);
    for (File& file : files) {
        if (file.identity.empty()) {
            continue;
        }
        const auto known = std::ranges::find(before, file.identity, &FileProgress::identity);
        FileProgress& progress = now.emplace_back();
        if (known != before.end()) {
            progress = std::move(*known);
            before.erase(known);
        }
        progress.identity = file.identity;
        const std::uint64_t linesBefore = progress.lines;
        count(file.descriptor.get(), file.size, progress);
        newLines_ += progress.lines - std::min(progress.lines, linesBefore);
        progress.written = file.written;
    }
    std::erase_if(files, [](const File& file) { return file.identity.empty(); });
    files_ = std::move(files);
    progress_ = std::move(now);
    MissedLines missed;
    if (!problems_.empty()) {
        // What is not there may be in a file that cannot be read.
        const std::size_t kept = std::min(before.size(), kMostUnseen);
        unseen_.assign(before.end() - static_cast<std::ptrdiff_t>(kept), before.end());
        before.resize(before.size() - kept);
    }
    for (const FileProgress& file : before) {
        missed.known += file.leftLines();
    }
    if (!before.empty() && before.back().identity == newest) {
        missed.uncounted = {.from = before.back().written,
                            .to = files_.empty() ? 0 : timeOfFirstLine(files_.front().descriptor.get())};
    }
    return missed;
}

Piece SinkBacklog::next(Order order, std::uint64_t mostLines) const {
    for (std::size_t i = 0; i != files_.size(); ++i) {
        const bool isNewest = order == Order::newestFirst;
        const std::size_t at = isNewest ? files_.size() - 1 - i : i;
        const FileProgress& file = progress_[at];
        const Range left = isNewest ? file.lastLeft() : file.firstLeft();
        if (left.begin >= left.end) {
            continue;
        }
        const int descriptor = files_[at].descriptor.get();
        Piece piece = isNewest ? lastOf(descriptor, file, mostLines) : firstOf(descriptor, file, mostLines);
        // One that was cut off since the last look has none.
        if (piece.lines != 0) {
            return piece;
        }
    }
    return {};
}

void SinkBacklog::take(const Piece& piece) {
    const auto file = std::ranges::find(progress_, piece.identity, &FileProgress::identity);
    if (file != progress_.end()) {
        file->take(piece.range, piece.lines);
    }
}

SinkProgress SinkBacklog::progress() const {
    SinkProgress all = unseen_;
    std::ranges::copy(progress_, std::back_inserter(all));
    return all;
}

std::uint64_t SinkBacklog::leftLines() const {
    std::uint64_t left = 0;
    for (const FileProgress& file : progress_) {
        left += file.leftLines();
    }
    return left;
}

} // namespace tamblo::tools
