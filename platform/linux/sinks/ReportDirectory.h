#pragma once

#include "base/Mutex.h"
#include "os/FileOperations.h"
#include "os/HeldDirectory.h"
#include "platform/Clock.h"
#include "platform/ReportFiles.h"
#include "platform/StructuredLog.h"
#include "platform/linux/sinks/FileModes.h"

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <variant>

#include <dirent.h>

namespace tamblo {

/// How many reports of one kind are kept.
struct ReportLimits {
    /// Whoever wants them collects them within days.
    std::chrono::hours age = std::chrono::days(14);
    std::size_t files = 256;
    std::uint64_t bytes = 256U << 20U; ///< of all
    /// Of one. A session of a hundred thousand messages has a report of some 50 MB.
    std::uint64_t fileBytes = 128U << 20U;

    /// A device's maker may change number and bytes: `report_files` and `report_bytes`, of each kind, in the
    /// domain of the limits.
    [[nodiscard]] static ReportLimits read(const Preferences& preferences);
};

/// The directory with the reports of one kind, a file each, of which it keeps the newest.
///
/// A report that is made, or grows, removes those that are too old, and the oldest where there is no room for
/// all: before it takes the room, so that the limits hold at every moment. Reports of a time that is still to
/// come, by a clock that was set back, make room first; none that is being written is removed. Only what has
/// the name of a report is counted and removed: what others put there stays. A report that takes the name of
/// one that is still being written leaves that writer a file without a name, which counts no more.
///
/// What is there is known by heart: the directory is read once, a few hundred entries with each new report,
/// so that a directory full of other people's files costs no report more than that. Until it has been read to
/// its end, old reports may be left. Any thread; a file is used by one at a time, and waits for the disk.
class ReportDirectory {
public:
    /// Clock, log and operations must outlive this object, as this must its files.
    /// The category code, under which failures are logged, must be a constant.
    ReportDirectory(const std::string& root, std::string_view below, std::string_view categoryCode,
                    const Clock& clock, StructuredLog& log, FileModes modes, ReportLimits limits,
                    FileOperations& operations);

    [[nodiscard]] const std::string& path() const noexcept { return directory_.path(); }
    /// Makes the directory; answers what went wrong, or nothing.
    [[nodiscard]] std::optional<std::string> make();
    /// A new empty file in place of a report that has the name, or what went wrong; anything else that has it
    /// stays.
    [[nodiscard]] std::variant<std::unique_ptr<ReportFile>, std::string> create(const std::string& name);
    /// Whether the last try to make or write a report failed. Waits for nobody who writes.
    [[nodiscard]] bool isOut() const noexcept { return isOut_; }

private:
    class File;
    struct Report {
        WallTime modified;
        std::uint64_t size = 0;
        const File* writer = nullptr;
    };
    using Reports = std::map<std::string, Report, std::less<>>;

    [[nodiscard]] std::variant<std::unique_ptr<ReportFile>, std::string> open(const std::string& name);
    /// Makes room for what the file is about to write, and counts it.
    void grow(const File& file, std::size_t bytes) TAMBLO_EXCLUDES(mutex_);
    /// Takes back what could not be written.
    void shrink(const File& file, std::size_t bytes) noexcept TAMBLO_EXCLUDES(mutex_);
    void finish(const File& file) noexcept TAMBLO_EXCLUDES(mutex_);
    /// The report that the file is, or null when another one has its name.
    [[nodiscard]] Report* reportOf(const File& file) noexcept TAMBLO_REQUIRES(mutex_);

    /// Forgets what is known of another directory, and sees to it that this one is read.
    void use(const HeldDirectory::Ref& directory) TAMBLO_REQUIRES(mutex_);
    void learnMore() TAMBLO_REQUIRES(mutex_);
    void learn(const std::string& name) TAMBLO_REQUIRES(mutex_);
    void makeRoom(std::size_t files, std::uint64_t bytes) TAMBLO_REQUIRES(mutex_);
    [[nodiscard]] bool isOver(std::size_t files, std::uint64_t bytes) const TAMBLO_REQUIRES(mutex_) {
        return reports_.size() + files > limits_.files || bytes_ + bytes > limits_.bytes;
    }
    [[nodiscard]] Reports::iterator firstToGo(WallTime now) TAMBLO_REQUIRES(mutex_);
    void lookAgain() TAMBLO_REQUIRES(mutex_);
    void remove(Reports::iterator report) TAMBLO_REQUIRES(mutex_);
    void forget(Reports::iterator report) TAMBLO_REQUIRES(mutex_);

    const std::string_view categoryCode_;
    const Clock& clock_;
    StructuredLog& log_;
    const FileModes modes_;
    const ReportLimits limits_;
    FileOperations& operations_;
    HeldDirectory directory_;
    std::atomic<bool> isOut_{false};

    Mutex mutex_;
    HeldDirectory::Ref known_ TAMBLO_GUARDED_BY(mutex_); ///< the directory that the rest is about
    std::unique_ptr<DIR, int (*)(DIR*)> unread_ TAMBLO_GUARDED_BY(mutex_){nullptr, ::closedir};
    bool isRead_ TAMBLO_GUARDED_BY(mutex_) = false; ///< to its end
    Reports reports_ TAMBLO_GUARDED_BY(mutex_);
    std::uint64_t bytes_ TAMBLO_GUARDED_BY(mutex_) = 0;              ///< of the reports
    std::chrono::nanoseconds lookedAt_ TAMBLO_GUARDED_BY(mutex_){0}; ///< on the coarse clock
    bool isRemovingOut_ TAMBLO_GUARDED_BY(mutex_) = false;
};

} // namespace tamblo
