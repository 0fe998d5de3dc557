#pragma once

#include "base/TextBuffer.h"
#include "os/FileOperations.h"
#include "platform/StructuredLog.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <mutex>
#include <string>
#include <string_view>

namespace tamblo {

/// A sink: a file of lines that only grows.
///
/// Lines are formatted straight into a buffer and written out together by `flush`, with one system call as a
/// rule, or by themselves once enough of them wait. Any thread may append and flush; both take a lock, and
/// only writing blocks on the disk. Owned by the platform service whose records it keeps; what waits is
/// written when it is destroyed.
///
/// What the file holds are whole lines, each once, whatever fails: a line that was torn (by a full disk now,
/// or by a crash before) is cut off before anything follows it. Lines that cannot be written are lost and
/// counted; an outage is one error line when it begins and one when it ends. Every flush tries again, from
/// opening the file on. A file that others remove or rename is begun anew within a tenth of a second.
class AppendOnlyFile {
public:
    struct Limits {
        /// A line that would make the file larger begins a new file.
        std::uint64_t fileSize = 64U << 20U;
        /// Waiting bytes that are written without being asked for.
        std::size_t waiting = 256U << 10U;
    };
    /// How many earlier files are kept, as NAME.1 (the latest) to NAME.4.
    static constexpr int kKeptFiles = 4;

    /// Cuts off a torn last line if the file exists; creates it with the first line. Failures are reported in
    /// the log, under the category code, which must be a constant. Log and operations must outlive the file.
    AppendOnlyFile(std::string path, std::string_view categoryCode, StructuredLog& log,
                   FileOperations& operations = FileOperations::system());
    AppendOnlyFile(std::string path, std::string_view categoryCode, StructuredLog& log,
                   FileOperations& operations, Limits limits);
    ~AppendOnlyFile();
    AppendOnlyFile(const AppendOnlyFile&) = delete;
    AppendOnlyFile& operator=(const AppendOnlyFile&) = delete;

    /// Adds one line. `format` is called at once, with the lock held, and appends the line to the
    /// `TextBuffer&` that it is given, without a line end, touching nothing of what stands there already.
    template <typename Format> void append(Format&& format) {
        const std::lock_guard lock(mutex_);
        OpenLine line(*this);
        format(waiting_);
        line.complete();
    }

    /// Writes out what waits: afterwards it is in the kernel's hands, or lost and counted.
    void flush();

    [[nodiscard]] const std::string& path() const noexcept { return path_; }

private:
    /// The line being appended; takes it back when it is not completed.
    class OpenLine {
    public:
        explicit OpenLine(AppendOnlyFile& file) noexcept : file_(file), start_(file.waiting_.size()) {}
        ~OpenLine() {
            if (!complete_) {
                file_.waiting_.truncate(start_);
            }
        }
        OpenLine(const OpenLine&) = delete;
        OpenLine& operator=(const OpenLine&) = delete;
        void complete() {
            file_.waiting_.append('\n');
            complete_ = true;
            if (file_.waiting_.size() >= file_.limits_.waiting) {
                file_.writeOut();
            }
        }

    private:
        AppendOnlyFile& file_;
        const std::size_t start_;
        bool complete_ = false;
    };

    // All of these with the lock held. Those that answer a boolean leave the reason of a failure in `fault_`.
    void writeOut();
    [[nodiscard]] bool writeLines(std::string_view& lines);
    [[nodiscard]] bool writeFully(std::string_view& lines, std::size_t length);
    void cutTornLine(std::size_t tornBytes) noexcept;
    [[nodiscard]] bool isStillInPlace() noexcept;
    [[nodiscard]] bool openFile(int creationFlag);
    [[nodiscard]] bool adopt(int descriptor);
    [[nodiscard]] bool findEndOfLastLine(int descriptor, std::uint64_t& end);
    [[nodiscard]] bool rotate();
    [[nodiscard]] std::size_t linesThatFit(std::string_view lines) const noexcept;
    void closeFile() noexcept;
    [[nodiscard]] bool failed(std::string_view action);
    void endOutage(std::string_view ending);

    const std::string path_;
    const std::string_view categoryCode_;
    const Limits limits_;
    StructuredLog& log_;
    FileOperations& operations_;

    std::mutex mutex_; ///< guards what follows
    TextBuffer waiting_;
    int descriptor_ = -1;
    std::uint64_t size_ = 0;
    dev_t device_ = 0;
    ino_t inode_ = 0;
    std::chrono::nanoseconds pathCheckedAt_{0}; ///< on the coarse clock
    bool isOut_ = false;
    std::uint64_t lostLines_ = 0;
    std::string fault_;
};

} // namespace tamblo
