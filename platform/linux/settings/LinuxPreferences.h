#pragma once

#include "base/Dictionary.h"
#include "base/Mutex.h"
#include "os/DirectoryWatcher.h"
#include "os/PreferenceFile.h"
#include "platform/Preferences.h"
#include "platform/StructuredLog.h"
#include "platform/linux/settings/JsonFile.h"

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>

namespace tamblo {

/// Preferences as files (`PreferenceFile`), one for each domain.
///
/// A file is read when its domain is first asked for and kept until it changes. Changes are told by the
/// kernel: the event loop calls `readChanges` when the descriptor is readable, before it handles the sockets
/// of the same wake-up, so that a preference is in force for every message sent after it was written. Any
/// thread may ask.
///
/// A file that is there and cannot be read (no descriptor is left, the disk fails) leaves its domain as it
/// was, absent if it was never read. It is tried again when somebody next asks for a value or the generation,
/// but at most once a second.
///
/// A value that is set is in force at once, and is stored when setting it returns: that waits for other
/// programs that edit the file, within bounds, and for the disk, but nobody who asks waits along. What could
/// not be stored is one error line for as long as that lasts, and is read back by this process all the same,
/// until the file changes.
class LinuxPreferences final : public Preferences {
public:
    using SteadyNow = std::function<std::chrono::steady_clock::time_point()>;

    /// The log must outlive the preferences.
    LinuxPreferences(std::string directory, StructuredLog& log,
                     SteadyNow now = std::chrono::steady_clock::now);

    [[nodiscard]] std::optional<Value> copyPreferenceValue(std::string_view key,
                                                           std::string_view domain) const override;
    void setPreferenceValue(std::string_view key, std::string_view domain, const Value& value) override;

    /// The file of a domain, whether it is there or not.
    [[nodiscard]] std::string path(std::string_view domain) const;

    /// For the event loop; -1 when changes cannot be noticed (said in the log; files are then read at every
    /// request).
    [[nodiscard]] int fileDescriptor() const noexcept { return watcher_.fileDescriptor(); }
    void readChanges();
    /// Another number after every change of a preference: what was worked out from preferences holds for as
    /// long as this stays the same. Never 0. Read it before the preferences themselves. While a file cannot
    /// be read, it is tried again from here, under the lock: at most once a second, asking waits for the
    /// disk.
    [[nodiscard]] std::uint64_t generation() const {
        if (isAnyUnreadable_.load(std::memory_order_relaxed)) {
            const MutexLock lock(mutex_);
            readAgain();
        }
        return generation_.load(std::memory_order_acquire);
    }

private:
    struct Domain {
        PreferenceFile editable;
        JsonFile file;
        bool isCurrent = false;
        std::optional<Dictionary> values = std::nullopt;
        /// Set here and not in the file.
        Dictionary unstored = {};
        ToldOnce told = {};

        void forgetFile() {
            isCurrent = false;
            unstored = {};
        }
    };

    void reportUnwatched();
    void read(Domain& domain) const TAMBLO_REQUIRES(mutex_);
    /// What could not be read, if that was a second ago.
    void readAgain() const TAMBLO_REQUIRES(mutex_);
    /// Null for a name that no domain can have.
    [[nodiscard]] Domain* domainNamed(std::string_view name) const TAMBLO_REQUIRES(mutex_);

    StructuredLog& log_;
    const SteadyNow now_;
    mutable std::atomic<std::uint64_t> generation_{1};
    mutable std::atomic<bool> isAnyUnreadable_{false};
    std::atomic<bool> isWatched_{false};
    /// Used by `readChanges` alone.
    DirectoryWatcher watcher_;
    ToldOnce unwatched_;
    mutable Mutex mutex_;
    mutable std::map<std::string, Domain, std::less<>> domains_ TAMBLO_GUARDED_BY(mutex_);
    mutable std::chrono::steady_clock::time_point triedAt_ TAMBLO_GUARDED_BY(mutex_);
};

} // namespace tamblo
