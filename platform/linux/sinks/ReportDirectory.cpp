#include "platform/linux/sinks/ReportDirectory.h"

#include "base/Format.h"
#include "platform/Counters.h"
#include "platform/Limits.h"

#include <algorithm>
#include <cerrno>
#include <system_error>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>

namespace tamblo {

namespace {

/// How many entries of a directory that is not known yet are looked at with each report.
constexpr std::size_t kEntriesAtATime = 512;
/// How old what is known of the reports may be when some have to go: others may have removed some meanwhile.
constexpr std::chrono::seconds kKnowledgeAge{1};

std::string textOf(int error) {
    return std::generic_category().message(error);
}

WallTime timeOf(const timespec& time) noexcept {
    return WallTime(std::chrono::duration_cast<WallTime::duration>(std::chrono::seconds(time.tv_sec) +
                                                                   std::chrono::nanoseconds(time.tv_nsec)));
}

/// Whether a name begins with a time and a reporter's number, as
/// "20260301-120000+0100-7-music-telephony.json".
bool isReport(std::string_view name) noexcept {
    constexpr std::string_view kTime = "00000000-000000+0000-";
    const auto isDigit = [](char character) { return character >= '0' && character <= '9'; };
    const auto matches = [&](char character, char pattern) {
        return pattern == '0' ? isDigit(character)
                              : character == pattern || (pattern == '+' && character == '-');
    };
    if (!name.ends_with(".json") || !std::ranges::equal(name.substr(0, kTime.size()), kTime, matches)) {
        return false;
    }
    name.remove_prefix(kTime.size());
    name.remove_prefix(name.starts_with('-') ? 1 : 0);
    const auto end = std::ranges::find_if_not(name, isDigit);
    return end != name.begin() && end != name.end() && *end == '-';
}

} // namespace

class ReportDirectory::File final : public ReportFile {
public:
    File(ReportDirectory& owner, std::string name, int descriptor)
        : owner_(owner), name_(std::move(name)), descriptor_(descriptor) {}
    ~File() override {
        if (descriptor_ >= 0) {
            (void)close();
        }
    }
    File(const File&) = delete;
    File& operator=(const File&) = delete;

    [[nodiscard]] const std::string& name() const noexcept { return name_; }

    std::optional<std::string> write(std::string_view text) override {
        if (text.size() > owner_.limits_.fileBytes - size_) {
            return textOf(EFBIG);
        }
        owner_.grow(*this, text.size());
        size_ += text.size();
        const bool isWritten = owner_.operations_.writeAll(descriptor_, text);
        const int error = errno;
        owner_.isOut_ = !isWritten;
        if (isWritten) {
            return std::nullopt;
        }
        owner_.shrink(*this, text.size());
        size_ -= text.size();
        return textOf(error);
    }

    std::optional<std::string> close() override {
        owner_.finish(*this);
        // Closed also when it fails: the descriptor may already be somebody else's.
        if (owner_.operations_.close(std::exchange(descriptor_, -1)) != 0 && errno != EINTR) {
            return textOf(errno);
        }
        return std::nullopt;
    }

private:
    ReportDirectory& owner_;
    const std::string name_;
    int descriptor_;
    std::uint64_t size_ = 0;
};

ReportLimits ReportLimits::read(const Preferences& preferences) {
    ReportLimits limits;
    limits.files = Limits::preferenceOf(preferences, "report_files").value_or(limits.files);
    limits.bytes = Limits::preferenceOf(preferences, "report_bytes").value_or(limits.bytes);
    limits.fileBytes = std::min(limits.fileBytes, limits.bytes);
    return limits;
}

ReportDirectory::ReportDirectory(const std::string& root, std::string_view below,
                                 std::string_view categoryCode, const Clock& clock, StructuredLog& log,
                                 FileModes modes, ReportLimits limits, FileOperations& operations)
    : categoryCode_(categoryCode),
      clock_(clock),
      log_(log),
      modes_(modes),
      limits_(limits),
      operations_(operations),
      directory_(root, below, modes.directory, operations) {}

std::optional<std::string> ReportDirectory::make() {
    if (directory_.open() == nullptr) {
        isOut_ = true;
        return textOf(errno);
    }
    return std::nullopt;
}

std::variant<std::unique_ptr<ReportFile>, std::string> ReportDirectory::create(const std::string& name) {
    auto opened = open(name);
    if (std::holds_alternative<std::string>(opened)) {
        isOut_ = true;
    }
    return opened;
}

std::variant<std::unique_ptr<ReportFile>, std::string> ReportDirectory::open(const std::string& name) {
    const HeldDirectory::Ref directory = directory_.open();
    if (directory == nullptr) {
        return textOf(errno);
    }
    const MutexLock lock(mutex_);
    use(directory);
    learnMore();
    learn(name);
    makeRoom(reports_.contains(name) ? 0 : 1, 0);
    if (const auto former = reports_.find(name); former != reports_.end()) {
        // Removed and not emptied: it may still be written.
        if (operations_.remove(directory->get(), name.c_str()) != 0 && errno != ENOENT) {
            return textOf(errno);
        }
        forget(former);
    }
    constexpr int kFlags = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
    FileDescriptor opened(operations_.open(directory->get(), name.c_str(), kFlags, modes_.file));
    if (!opened.isOpen()) {
        return textOf(errno);
    }
    (void)::fchmod(opened.get(), modes_.file); // whatever the process's mask is
    Report& report = reports_[name];
    report.modified = clock_.now();
    auto file = std::make_unique<File>(*this, name, opened.release());
    report.writer = file.get();
    return file;
}

ReportDirectory::Report* ReportDirectory::reportOf(const File& file) noexcept {
    const auto report = reports_.find(file.name());
    return report != reports_.end() && report->second.writer == &file ? &report->second : nullptr;
}

void ReportDirectory::grow(const File& file, std::size_t bytes) {
    const MutexLock lock(mutex_);
    makeRoom(0, bytes);
    if (Report* const report = reportOf(file)) {
        report->size += bytes;
        bytes_ += bytes;
    }
}

void ReportDirectory::shrink(const File& file, std::size_t bytes) noexcept {
    const MutexLock lock(mutex_);
    if (Report* const report = reportOf(file)) {
        report->size -= bytes;
        bytes_ -= bytes;
    }
}

void ReportDirectory::finish(const File& file) noexcept {
    const MutexLock lock(mutex_);
    if (Report* const report = reportOf(file)) {
        report->writer = nullptr;
        report->modified = clock_.now();
    }
}

void ReportDirectory::use(const HeldDirectory::Ref& directory) {
    if (known_ != directory) {
        known_ = directory;
        reports_.clear();
        bytes_ = 0;
        unread_.reset();
        isRead_ = false;
    }
    if (isRead_ || unread_ != nullptr) {
        return;
    }
    // What cannot be opened now, for want of a descriptor, is tried again with the next report.
    FileDescriptor own(operations_.open(directory->get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC, 0));
    unread_.reset(own.isOpen() ? ::fdopendir(own.get()) : nullptr);
    if (unread_ != nullptr) {
        (void)own.release();
    }
}

void ReportDirectory::learnMore() {
    for (std::size_t i = 0; unread_ != nullptr && i < kEntriesAtATime; ++i) {
        errno = 0;
        if (const dirent* const entry = ::readdir(unread_.get())) {
            learn(entry->d_name);
        } else {
            isRead_ = errno == 0;
            unread_.reset();
        }
    }
}

void ReportDirectory::learn(const std::string& name) {
    struct stat status {};
    if (!isReport(name) || reports_.contains(name) ||
        operations_.status(known_->get(), name.c_str(), status) != 0 || !S_ISREG(status.st_mode)) {
        return;
    }
    const auto size = static_cast<std::uint64_t>(status.st_size);
    reports_.emplace(name, Report{.modified = timeOf(status.st_mtim), .size = size});
    bytes_ += size;
}

/// For so many more files and bytes.
void ReportDirectory::makeRoom(std::size_t files, std::uint64_t bytes) {
    const std::chrono::nanoseconds time = operations_.coarseTime();
    if (isOver(files, bytes) && time - lookedAt_ >= kKnowledgeAge) {
        lookedAt_ = time;
        lookAgain();
    }
    if (files == 0 && !isOver(files, bytes)) {
        return; // ages are looked at with each new report
    }
    const WallTime now = clock_.now();
    for (;;) {
        const bool isTooMuch = isOver(files, bytes);
        // By age alone, what is of a time to come is the youngest.
        const auto report = firstToGo(isTooMuch ? now : WallTime::max());
        if (report == reports_.end() || (!isTooMuch && report->second.modified >= now - limits_.age)) {
            return;
        }
        remove(report);
    }
}

/// Of those that nobody writes: what is of a time after `now`, then the oldest.
ReportDirectory::Reports::iterator ReportDirectory::firstToGo(WallTime now) {
    auto first = reports_.end();
    const auto rank = [now](const Report& report) {
        return std::pair(report.modified <= now, report.modified);
    };
    for (auto report = reports_.begin(); report != reports_.end(); ++report) {
        if (report->second.writer == nullptr &&
            (first == reports_.end() || rank(report->second) < rank(first->second))) {
            first = report;
        }
    }
    return first;
}

void ReportDirectory::lookAgain() {
    for (auto report = reports_.begin(); report != reports_.end();) {
        const auto looked = report++;
        struct stat status {};
        if (looked->second.writer == nullptr &&
            operations_.status(known_->get(), looked->first.c_str(), status) != 0) {
            forget(looked);
        }
    }
}

void ReportDirectory::remove(Reports::iterator report) {
    const bool isGone = operations_.remove(known_->get(), report->first.c_str()) == 0 || errno == ENOENT;
    if (!isGone && !isRemovingOut_) {
        log_.report(LogLevel::error, categoryCode_,
                    formatted("{}/{}: cannot be removed: {}; it takes room that is not counted", path(),
                              report->first, textOf(errno)));
    }
    isRemovingOut_ = !isGone;
    counters::add(counters::Counter::reportsRemoved, isGone ? 1 : 0);
    forget(report);
}

void ReportDirectory::forget(Reports::iterator report) {
    bytes_ -= report->second.size;
    reports_.erase(report);
}

} // namespace tamblo
