#pragma once

#include "base/JsonObject.h"
#include "base/Mutex.h"
#include "base/TextBuffer.h"
#include "os/FileOperations.h"
#include "os/HeldDirectory.h"
#include "platform/Clock.h"
#include "platform/Counters.h"
#include "platform/StructuredLog.h"
#include "platform/linux/sinks/FileModes.h"
#include "platform/linux/sinks/PayloadTexts.h"

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

class AppendOnlyFile;

/// The files of all sinks: where they stand, what tells of their failures, and the one place from which they
/// are written out. A file cannot be made without it, so that none is forgotten when replies are about to
/// leave. Made by whoever wires the platform; outlives the sinks. Any thread.
class SinkFiles {
public:
    /// Log and operations must outlive this object.
    SinkFiles(std::string directory, StructuredLog& log,
              FileOperations& operations = FileOperations::system(), FileModes modes = {});

    /// What the files' lines share.
    [[nodiscard]] PayloadTexts& payloadTexts() noexcept { return payloadTexts_; }

    /// Ends a batch: writes out what waits in all files that are written before replies. It costs a look at
    /// each file where nothing waits; returns when what was appended before the call, on any thread, is in
    /// the kernel's hands, or lost and counted.
    void flush();

    /// The path and whether it can be written, of each file. Waits for nobody who writes.
    struct State {
        std::string name;
        std::string path;
        bool isOut;
    };
    [[nodiscard]] std::vector<State> states() const;
    /// The names of the files that cannot be written now, in no order. Waits for nobody who writes.
    [[nodiscard]] std::vector<std::string> out() const;
    /// How many lines all files have lost since the start, those that were too long among them.
    [[nodiscard]] std::uint64_t lostLines() const noexcept {
        return lostLines_.load(std::memory_order_relaxed);
    }

private:
    friend class AppendOnlyFile;
    void add(AppendOnlyFile& file, bool isFlushedHere);
    void remove(AppendOnlyFile& file);

    HeldDirectory directory_;
    StructuredLog& log_;
    FileOperations& operations_;
    const FileModes modes_;
    PayloadTexts payloadTexts_;

    Mutex mutex_; ///< held while files are written
    std::vector<AppendOnlyFile*> flushed_ TAMBLO_GUARDED_BY(mutex_);
    mutable Mutex listMutex_;
    std::vector<AppendOnlyFile*> files_ TAMBLO_GUARDED_BY(listMutex_);
    std::atomic<std::uint64_t> lostLines_{0};
};

struct SinkFileLimits {
    /// A line that would make the file larger begins a new file.
    std::uint64_t fileSize = 64U << 20U;
    /// A longer line is lost: bounds what one line takes in memory, as text. Two and a half times what comes
    /// of any one request; what is derived from several may be longer (`docs/sinks.md` says what).
    std::size_t line = 16U << 20U;
    /// Waiting bytes that are written without being asked for.
    std::size_t waiting = 256U << 10U;
};

/// A sink: a file of lines that only grows, owned by the platform service whose records it keeps.
///
/// One write for many lines. A system call costs more than a line does, so lines are formatted straight into
/// one buffer and handed to the kernel together. They are in its hands before the replies to what caused them
/// leave: the end of each batch of requests flushes all files (`SinkFiles`), then lets the replies go, so
/// that a service that is killed loses nothing that it has answered. Nothing is synced: a loss of power may
/// cost what the kernel had not written yet. A file whose lines come from a queue of their own is flushed by
/// its owner, there; no reply waits for it.
///
/// Who may block. Any thread may append and flush. Both take the file's lock, which is held while the file is
/// written; who flushes a file where nothing waits takes no lock.
///
/// Whole lines, each once, whatever fails. A full disk, or a crash, may tear the last line: its rest is cut
/// off before anything follows it, at once where that works, else when the file is opened again. What a write
/// has not brought into the file is lost and counted, as keeping it would take memory without end. So is a
/// line that is longer than lines may be; the log tells of the first, and then each time that there are twice
/// as many.
///
/// An outage is two lines in the log, one when it begins and one, with the count, when it ends, lest a full
/// disk be filled with words about it. Every flush tries again, from opening the file on. One that lasts
/// until the file's owner goes ends then, with its count.
///
/// Rotation. A file that is full becomes NAME.1, the earlier ones move up, NAME.4 goes. They move only as far
/// as the first free number: a rotation that fails half-way and is tried again pushes none of them out.
///
/// The file is made in the directory that is held open (`HeldDirectory`), and is never reached through a
/// symbolic link. Directory and file are looked up every tenth of a second, since a look costs half of what a
/// small write does: a file that others remove or rename is begun anew, and what was written in between went
/// with it.
class AppendOnlyFile {
public:
    enum class Flushed { beforeReplies, byOwner };
    static constexpr int kKeptFiles = 4;

    /// The file's name has no directory; the category code, under which failures are logged, must be a
    /// constant. What the file holds already has a torn last line cut off; it is created with the first line.
    AppendOnlyFile(SinkFiles& sinks, std::string_view name, std::string_view categoryCode,
                   Flushed flushed = Flushed::beforeReplies, SinkFileLimits limits = {});
    /// Writes out what waits.
    ~AppendOnlyFile();
    AppendOnlyFile(const AppendOnlyFile&) = delete;
    AppendOnlyFile& operator=(const AppendOnlyFile&) = delete;

    /// Adds one line. `format` is called at once, with the lock held, and appends the line to the
    /// `TextBuffer&` that it is given, without a line end. What stands there already are the lines that wait:
    /// it may read them and changes none. A line that it throws out of is taken back.
    template <typename Format> void append(Format&& format) {
        const MutexLock lock(mutex_);
        appendLine(format);
    }
    /// The same for a line of each of these things, which `format` is given as well.
    template <typename Things, typename Format> void appendLines(const Things& things, Format&& format) {
        const MutexLock lock(mutex_);
        for (const auto& thing : things) {
            appendLine([&](TextBuffer& lines) { format(lines, thing); });
        }
    }

    /// Adds one line where that needs no waiting for anybody, nor for the disk: it is for the caller to flush
    /// the file in time. The bytes that wait then; nothing where the line was not added.
    template <typename Format> [[nodiscard]] std::optional<std::size_t> tryAppend(Format&& format) {
        if (!mutex_.try_lock()) {
            return std::nullopt;
        }
        std::optional<std::size_t> waiting;
        try {
            if (waiting_.size() < kMostWaitingUnwritten) {
                addLine(format);
                waiting = waiting_.size();
            }
        } catch (...) {
            mutex_.unlock();
            throw;
        }
        mutex_.unlock();
        return waiting;
    }

    /// Bytes of a line, with its line end.
    [[nodiscard]] std::size_t longestLine() const noexcept {
        return static_cast<std::size_t>(std::min<std::uint64_t>(limits_.line, limits_.fileSize));
    }
    /// In place of appending a line of which it is known that it would be too long.
    void loseTooLong() {
        const MutexLock lock(mutex_);
        countTooLong();
    }
    /// Whether there is something for `flush` to do, or somebody is about it.
    [[nodiscard]] bool isWaiting() const noexcept { return isWaiting_.load(std::memory_order_acquire); }
    [[nodiscard]] bool isOut() const noexcept { return isOut_.load(std::memory_order_relaxed); }

    /// Writes out what waits: afterwards it is in the kernel's hands, or lost and counted.
    void flush();

    [[nodiscard]] const std::string& name() const noexcept { return name_; }
    [[nodiscard]] const std::string& path() const noexcept { return path_; }

private:
    static constexpr std::size_t kMostWaitingUnwritten = 1U << 20U;

    template <typename Format> void addLine(Format&& format) TAMBLO_REQUIRES(mutex_) {
        const std::size_t start = waiting_.size();
        try {
            format(waiting_);
            waiting_.append('\n');
        } catch (...) {
            waiting_.truncate(start);
            throw;
        }
        if (waiting_.size() - start > longestLine()) {
            waiting_.truncate(start);
            countTooLong();
            return;
        }
        ++waitingLines_;
        isWaiting_.store(true, std::memory_order_release);
    }
    template <typename Format> void appendLine(Format&& format) TAMBLO_REQUIRES(mutex_) {
        addLine(format);
        if (waiting_.size() >= limits_.waiting) {
            writeOut();
        }
    }
    // Those that answer a boolean leave the reason of a failure in `fault_`.
    void writeOut() TAMBLO_REQUIRES(mutex_);
    [[nodiscard]] bool writeLines(std::string_view& lines) TAMBLO_REQUIRES(mutex_);
    [[nodiscard]] bool writeFully(std::string_view& lines, std::size_t length) TAMBLO_REQUIRES(mutex_);
    void cutTornLine(std::size_t tornBytes) noexcept TAMBLO_REQUIRES(mutex_);
    [[nodiscard]] bool isStillInPlace() noexcept TAMBLO_REQUIRES(mutex_);
    enum class IfMissing { fail, create };
    [[nodiscard]] bool openFile(IfMissing ifMissing) TAMBLO_REQUIRES(mutex_);
    [[nodiscard]] bool resumeFile(int descriptor) TAMBLO_REQUIRES(mutex_);
    [[nodiscard]] bool findEndOfLastLine(int descriptor, std::uint64_t& end);
    [[nodiscard]] bool rotate() TAMBLO_REQUIRES(mutex_);
    [[nodiscard]] std::size_t linesThatFit(std::string_view lines) const noexcept TAMBLO_REQUIRES(mutex_);
    void closeFile() noexcept TAMBLO_REQUIRES(mutex_);
    [[nodiscard]] bool failed(std::string_view action) TAMBLO_REQUIRES(mutex_);
    void beginOutage() TAMBLO_REQUIRES(mutex_);
    void endOutage(std::string_view ending) TAMBLO_REQUIRES(mutex_);
    void countTooLong() TAMBLO_REQUIRES(mutex_);

    SinkFiles& sinks_;
    FileOperations& operations_;
    const std::string name_;
    const std::string path_;
    const std::string_view categoryCode_;
    const SinkFileLimits limits_;
    const counters::OfSink counted_;

    /// Whether lines wait, or are being written.
    std::atomic<bool> isWaiting_{false};
    Mutex mutex_;
    TextBuffer waiting_ TAMBLO_GUARDED_BY(mutex_);
    std::uint64_t waitingLines_ TAMBLO_GUARDED_BY(mutex_) = 0;
    HeldDirectory::Ref directory_ TAMBLO_GUARDED_BY(mutex_); ///< that of the open file
    int descriptor_ TAMBLO_GUARDED_BY(mutex_) = -1;
    std::uint64_t size_ TAMBLO_GUARDED_BY(mutex_) = 0;
    dev_t device_ TAMBLO_GUARDED_BY(mutex_) = 0;
    ino_t inode_ TAMBLO_GUARDED_BY(mutex_) = 0;
    /// On the coarse clock.
    std::chrono::nanoseconds pathCheckedAt_ TAMBLO_GUARDED_BY(mutex_){0};
    std::atomic<bool> isOut_{false};                        ///< written with the lock held
    std::uint64_t lostLines_ TAMBLO_GUARDED_BY(mutex_) = 0; ///< of the outage
    std::uint64_t tooLongLines_ TAMBLO_GUARDED_BY(mutex_) = 0;
    std::string fault_ TAMBLO_GUARDED_BY(mutex_);
};

/// One line of a sink: an object that begins with "time", the seconds since 1970.
class SinkLine : public JsonObject {
public:
    SinkLine(TextBuffer& line, WallTime time) : JsonObject(line) { number("time", secondsSince1970(time)); }
};

} // namespace tamblo
