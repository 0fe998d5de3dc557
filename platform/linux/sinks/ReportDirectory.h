#pragma once

#include "base/Mutex.h"
#include "os/FileOperations.h"
#include "os/HeldDirectory.h"
#include "platform/Clock.h"
#include "platform/ReportFiles.h"
#include "platform/StructuredLog.h"
#include "platform/linux/sinks/FileModes.h"

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
/// the name of a report is counted and removed: what others put there stays.
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
    /// A new empty file in place of any that has the name, or what went wrong. Opened only where the name is
    /// a regular file or free.
    [[nodiscard]] std::variant<std::unique_ptr<ReportFile>, std::string> create(const std::string& name);

private:
    class File;
    struct Report {
        WallTime modified;
        std::uint64_t size = 0;
        int writers = 0;
    };
    using Reports = std::map<std::string, Report, std::less<>>;

    void grow(const std::string& name, std::size_t bytes) TAMBLO_EXCLUDES(mutex_);
    void finish(const std::string& name) noexcept TAMBLO_EXCLUDES(mutex_);

    /// Forgets what is known of another directory.
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

    Mutex mutex_;
    HeldDirectory::Ref known_ TAMBLO_GUARDED_BY(mutex_); ///< the directory that the rest is about
    std::unique_ptr<DIR, int (*)(DIR*)> unread_ TAMBLO_GUARDED_BY(mutex_){nullptr, ::closedir};
    Reports reports_ TAMBLO_GUARDED_BY(mutex_);
    std::uint64_t bytes_ TAMBLO_GUARDED_BY(mutex_) = 0;              ///< of the reports
    std::chrono::nanoseconds lookedAt_ TAMBLO_GUARDED_BY(mutex_){0}; ///< on the coarse clock
    bool isRemovingOut_ TAMBLO_GUARDED_BY(mutex_) = false;
};

} // namespace tamblo
