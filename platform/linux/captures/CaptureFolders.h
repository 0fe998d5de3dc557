#pragma once

#include "os/HeldDirectory.h"
#include "os/SmallFile.h"
#include "platform/Clock.h"
#include "platform/StructuredLog.h"
#include "platform/linux/sinks/FileModes.h"

#include <atomic>
#include <chrono>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace tamblo {

/// A file of a capture, as it is to stand in the capture's folder.
struct CaptureFile {
    std::string name;
    std::string text;
};

/// The directory with a folder for each capture, named by its identifier.
///
/// A folder is written under another name, which begins with a dot, and renamed when it is complete: what has
/// a capture's name is whole, whenever the service was killed. What such a one left is removed with the next
/// capture, as are folders that are old or more than there is room for, the oldest first. Only what the
/// service has named itself is removed, and no symbolic link in the directory is followed.
///
/// The clock may be set in between: the folder that was just written stays, however long ago its capture was
/// asked for, and folders of a time that is still to come are the first to make room.
///
/// Directory and files are the owner's alone, unless the modes say otherwise, and the directory is held open
/// (`HeldDirectory`). One that cannot be written is one error line in the log until it can be again. Used by
/// one thread at a time, which waits for the disk.
class CaptureFolders {
public:
    /// Whoever follows a fault up takes the captures within a few weeks; what they tell of processes is not
    /// to stay on the device for longer.
    static constexpr std::chrono::days kMaximumAge{30};
    struct Limits {
        /// Of all folders, by the lengths of their files. One has 1 MiB of log at most, and some kilobytes
        /// for each process.
        std::uint64_t totalSize = 200U << 20U;
    };

    /// The directory is made with the first folder; its parent has to be there. The log must outlive this
    /// object.
    CaptureFolders(const std::string& directory, StructuredLog& log, FileModes modes = {})
        : CaptureFolders(directory, log, modes, {}) {}
    CaptureFolders(const std::string& directory, StructuredLog& log, FileModes modes, Limits limits);

    /// An identifier, `20260301T120000.250Z-9f86d081`: sorts by time, is a file name everywhere, and is
    /// unique as the number, of which the last 32 bits are taken, is.
    [[nodiscard]] static std::string identifier(WallTime time, std::uint64_t number);

    /// Writes a capture's folder, or none.
    void store(std::string_view identifier, std::span<const CaptureFile> files, WallTime now);
    /// Replaces a file beside the folders. That it cannot be written is told with the next folder that can.
    void keep(std::string_view name, std::string_view text);
    /// What such a file, of some kilobytes at most, holds. Makes no directory where there is none.
    [[nodiscard]] SmallFile kept(std::string_view name);
    [[nodiscard]] const std::string& path() const noexcept { return directory_.path(); }
    /// Whether the last folder could not be written. Any thread.
    [[nodiscard]] bool isOut() const noexcept { return isWritingOut_; }

private:
    [[nodiscard]] std::string write(int directory, const std::string& identifier,
                                    std::span<const CaptureFile> files) const;
    [[nodiscard]] std::string writeFiles(int directory, const std::string& folder,
                                         std::span<const CaptureFile> files) const;
    void removeOld(int directory, WallTime now, std::string_view latest);
    void tell(std::atomic<bool>& isOut, std::string_view problem, std::string_view consequence);

    HeldDirectory directory_;
    StructuredLog& log_;
    const FileModes modes_;
    const Limits limits_;
    /// Whether the log knows that no folder can be written, no file beside them, or nothing removed.
    std::atomic<bool> isWritingOut_{false};
    std::atomic<bool> isKeepingOut_{false};
    std::string keepingProblem_; ///< the last try's
    std::atomic<bool> isRemovingOut_{false};
};

} // namespace tamblo
