#include "platform/linux/sinks/AppendOnlyFile.h"

#include "base/Format.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cerrno>
#include <memory>
#include <system_error>
#include <utility>

#include <fcntl.h>

namespace tamblo {

namespace {

/// A buffer that once held an unusually long line gives its memory back.
constexpr std::size_t kKeptCapacity = 1U << 20U;

/// How often the path of an open file is looked up.
constexpr std::chrono::milliseconds kPathCheckInterval{100};

std::uint64_t countLines(std::string_view lines) noexcept {
    return static_cast<std::uint64_t>(std::count(lines.begin(), lines.end(), '\n'));
}

/// The length of the whole lines among the first `length` bytes.
std::size_t wholeLines(std::string_view bytes, std::size_t length) noexcept {
    const std::size_t end = bytes.substr(0, length).find_last_of('\n');
    return end == std::string_view::npos ? 0 : end + 1;
}

} // namespace

SinkFiles::SinkFiles(std::string directory, StructuredLog& log, FileOperations& operations, FileModes modes)
    : directory_(std::move(directory), {}, modes.directory, operations),
      log_(log),
      operations_(operations),
      modes_(modes) {}

void SinkFiles::flush() {
    payloadTexts_.endBatch();
    const MutexLock lock(mutex_);
    for (AppendOnlyFile* file : flushed_) {
        file->flush();
    }
}

std::vector<SinkFiles::State> SinkFiles::states() const {
    std::vector<State> states;
    const MutexLock lock(listMutex_);
    states.reserve(files_.size());
    for (const AppendOnlyFile* file : files_) {
        states.push_back({file->name(), file->path(), file->isOut()});
    }
    return states;
}

std::vector<std::string> SinkFiles::out() const {
    std::vector<std::string> names;
    const MutexLock lock(listMutex_);
    for (const AppendOnlyFile* file : files_) {
        if (file->isOut()) {
            names.push_back(file->name());
        }
    }
    return names;
}

void SinkFiles::add(AppendOnlyFile& file, bool isFlushedHere) {
    if (isFlushedHere) {
        const MutexLock lock(mutex_);
        flushed_.push_back(&file);
    }
    const MutexLock lock(listMutex_);
    files_.push_back(&file);
}

void SinkFiles::remove(AppendOnlyFile& file) {
    {
        const MutexLock lock(mutex_);
        std::erase(flushed_, &file);
    }
    const MutexLock lock(listMutex_);
    std::erase(files_, &file);
}

AppendOnlyFile::AppendOnlyFile(SinkFiles& sinks, std::string_view name, std::string_view categoryCode,
                               Flushed flushed, SinkFileLimits limits)
    : sinks_(sinks),
      operations_(sinks.operations_),
      name_(name),
      path_(formatted("{}/{}", sinks.directory_.path(), name)),
      categoryCode_(categoryCode),
      limits_(limits),
      counted_(name) {
    // What fails here fails again with the first line, and is told then.
    static_cast<void>(openFile(IfMissing::fail));
    sinks_.add(*this, flushed == Flushed::beforeReplies);
}

AppendOnlyFile::~AppendOnlyFile() {
    sinks_.remove(*this);
    flush();
    if (isOut_) {
        endOutage("the service ends");
    }
    closeFile();
}

void AppendOnlyFile::flush() {
    // Stays set until the lines are written: who finds it unset has nothing to wait for.
    if (isWaiting()) {
        const MutexLock lock(mutex_);
        if (!waiting_.empty()) {
            writeOut();
        }
    }
}

void AppendOnlyFile::writeOut() {
    std::string_view lines = waiting_.view();
    const bool wasOut = isOut_;
    std::uint64_t lost = 0;
    if (writeLines(lines)) {
        if (wasOut) {
            endOutage("it can be written again");
        }
    } else {
        if (!wasOut) {
            beginOutage();
        }
        lost = countLines(lines);
        lostLines_ += lost;
        counted_.add(counters::SinkCount::lostOutage, lost);
        sinks_.lostLines_.fetch_add(lost, std::memory_order_relaxed);
    }
    counted_.add(counters::SinkCount::lines, std::exchange(waitingLines_, 0) - lost);
    if (waiting_.capacity() > kKeptCapacity) {
        waiting_.reset();
    }
    waiting_.clear();
    isWaiting_.store(false, std::memory_order_release);
}

void AppendOnlyFile::beginOutage() {
    isOut_ = true;
    counted_.add(counters::SinkCount::outages, 1);
    sinks_.log_.report(
        LogLevel::error, categoryCode_,
        formatted("{}: {}; its records are lost until it can be written again", path_, fault_));
}

/// A client can cause such lines: the log does not grow with their number.
void AppendOnlyFile::countTooLong() {
    sinks_.lostLines_.fetch_add(1, std::memory_order_relaxed);
    counted_.add(counters::SinkCount::lostTooLong, 1);
    if (std::has_single_bit(++tooLongLines_)) {
        sinks_.log_.report(LogLevel::error, categoryCode_,
                           formatted("{}: records of more than {} bytes are left out, {} until now", path_,
                                     longestLine(), tooLongLines_));
    }
}

void AppendOnlyFile::endOutage(std::string_view ending) {
    isOut_ = false;
    sinks_.log_.report(
        LogLevel::error, categoryCode_,
        formatted("{}: {}; {} records were lost", path_, ending, std::exchange(lostLines_, 0)));
}

/// Takes the lines that have been written off the front.
bool AppendOnlyFile::writeLines(std::string_view& lines) {
    if (!isStillInPlace()) {
        closeFile();
    }
    while (!lines.empty()) {
        if (descriptor_ < 0 && !openFile(IfMissing::create)) {
            return false;
        }
        const std::size_t length = linesThatFit(lines);
        if (length == 0) {
            if (!rotate()) {
                return false;
            }
            continue;
        }
        if (!writeFully(lines, length)) {
            return false;
        }
    }
    return true;
}

/// The length of the lines that the file still takes: no line is longer than an empty one has room for.
std::size_t AppendOnlyFile::linesThatFit(std::string_view lines) const noexcept {
    const std::uint64_t room = limits_.fileSize - std::min(size_, limits_.fileSize);
    if (lines.size() <= room) {
        return lines.size();
    }
    return wholeLines(lines, static_cast<std::size_t>(room));
}

bool AppendOnlyFile::writeFully(std::string_view& lines, std::size_t length) {
    std::string_view rest = lines.substr(0, length);
    if (!operations_.writeAll(descriptor_, rest)) {
        const bool result = failed("write");
        const std::size_t written = length - rest.size();
        const std::size_t whole = wholeLines(lines, written);
        cutTornLine(written - whole);
        counted_.add(counters::SinkCount::bytes, whole);
        lines.remove_prefix(whole);
        return result;
    }
    size_ += length;
    counted_.add(counters::SinkCount::bytes, length);
    lines.remove_prefix(length);
    return true;
}

/// Takes back the part of a line that was written last. The next thing that happens to the file is that it is
/// opened again.
void AppendOnlyFile::cutTornLine(std::size_t tornBytes) noexcept {
    struct stat status {};
    if (tornBytes != 0 && operations_.status(descriptor_, status) == 0 &&
        status.st_size >= static_cast<off_t>(tornBytes)) {
        static_cast<void>(operations_.truncate(descriptor_, status.st_size - static_cast<off_t>(tornBytes)));
    }
    closeFile();
}

/// Whether the path still leads to the file that is open; takes in its size, in case somebody shortened it.
bool AppendOnlyFile::isStillInPlace() noexcept {
    if (descriptor_ < 0) {
        return false;
    }
    const std::chrono::nanoseconds now = operations_.coarseTime();
    if (now - pathCheckedAt_ < kPathCheckInterval) {
        return true;
    }
    pathCheckedAt_ = now;
    struct stat status {};
    if (sinks_.directory_.open() != directory_ ||
        operations_.status(directory_->get(), name_.c_str(), status) != 0 || status.st_ino != inode_ ||
        status.st_dev != device_) {
        return false;
    }
    size_ = static_cast<std::uint64_t>(status.st_size);
    return true;
}

bool AppendOnlyFile::openFile(IfMissing ifMissing) {
    constexpr int kFlags = O_RDWR | O_APPEND | O_CLOEXEC | O_NOCTTY | O_NONBLOCK | O_NOFOLLOW;
    directory_ = sinks_.directory_.open();
    if (directory_ == nullptr) {
        return failed("open its directory");
    }
    int descriptor = operations_.open(directory_->get(), name_.c_str(), kFlags, 0);
    if (descriptor < 0 && errno == ENOENT && ifMissing == IfMissing::create) {
        const mode_t mode = sinks_.modes_.file;
        descriptor = operations_.open(directory_->get(), name_.c_str(), kFlags | O_CREAT | O_EXCL, mode);
        if (descriptor >= 0) {
            static_cast<void>(::fchmod(descriptor, mode)); // whatever the process's mask is
        }
    }
    if (descriptor < 0) {
        return failed("open");
    }
    if (resumeFile(descriptor)) {
        return true;
    }
    operations_.close(descriptor);
    return false;
}

/// Goes on behind the last whole line of a file.
bool AppendOnlyFile::resumeFile(int descriptor) {
    struct stat status {};
    if (operations_.status(descriptor, status) != 0) {
        return failed("examine");
    }
    if (!S_ISREG(status.st_mode)) {
        fault_ = "not a regular file";
        return false;
    }
    std::uint64_t end = static_cast<std::uint64_t>(status.st_size);
    if (!findEndOfLastLine(descriptor, end)) {
        return failed("read");
    }
    if (end != static_cast<std::uint64_t>(status.st_size) &&
        operations_.truncate(descriptor, static_cast<off_t>(end)) != 0) {
        return failed("cut a torn line off");
    }
    descriptor_ = descriptor;
    size_ = end;
    device_ = status.st_dev;
    inode_ = status.st_ino;
    return true;
}

/// Moves `end` back to behind the last line end before it.
bool AppendOnlyFile::findEndOfLastLine(int descriptor, std::uint64_t& end) {
    char last = '\0';
    if (end == 0) {
        return true;
    }
    if (operations_.readAt(descriptor, &last, 1, static_cast<off_t>(end - 1)) != 1) {
        return false;
    }
    if (last == '\n') {
        return true;
    }
    const auto block = std::make_unique<std::array<char, 65536>>();
    while (end != 0) {
        const std::size_t count = std::min<std::uint64_t>(end, block->size());
        const std::uint64_t start = end - count;
        if (operations_.readAt(descriptor, block->data(), count, static_cast<off_t>(start)) !=
            static_cast<ssize_t>(count)) {
            return false;
        }
        const std::size_t whole = wholeLines({block->data(), count}, count);
        end = start + whole;
        if (whole != 0) {
            break;
        }
    }
    return true;
}

/// Moves the file out of the way.
bool AppendOnlyFile::rotate() {
    const auto numbered = [this](int number) {
        return number == 0 ? name_ : formatted("{}.{}", name_, number);
    };
    const int directory = directory_->get();
    int free = 1;
    struct stat status {};
    while (free < kKeptFiles && operations_.status(directory, numbered(free).c_str(), status) == 0) {
        ++free;
    }
    const bool pushesOut =
        free == kKeptFiles && operations_.status(directory, numbered(free).c_str(), status) == 0;
    for (int number = free; number > 0; --number) {
        if (operations_.rename(directory, numbered(number - 1).c_str(), numbered(number).c_str()) != 0) {
            const bool result = failed("rename");
            closeFile();
            return result;
        }
    }
    counters::add(counters::Counter::sinkFilesRemoved, pushesOut ? 1 : 0);
    closeFile();
    return true;
}

void AppendOnlyFile::closeFile() noexcept {
    if (descriptor_ >= 0) {
        operations_.close(std::exchange(descriptor_, -1));
    }
}

bool AppendOnlyFile::failed(std::string_view action) {
    fault_ = formatted("cannot {}: {}", action, std::generic_category().message(errno));
    return false;
}

} // namespace tamblo
