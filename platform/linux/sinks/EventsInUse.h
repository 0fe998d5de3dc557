#pragma once

#include "platform/StructuredLog.h"
#include "platform/linux/settings/LinuxPreferences.h"

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// Answers which analytics events are in use: domain `com.vandra.tamblo.analytics`, key `events_in_use`, an
/// array of names, each exact or with one trailing `*`; without it all are.
///
/// Asked twice for every message, so answers are remembered per name until a preference changes. Remembered
/// names are never forgotten or moved, which lets any thread look one up without a lock; there is room for
/// far more names than the service can form, and a name beyond that is merely worked out each time.
class EventsInUse {
public:
    /// Both must outlive this.
    EventsInUse(const LinuxPreferences& preferences, StructuredLog& log);
    ~EventsInUse();
    EventsInUse(const EventsInUse&) = delete;
    EventsInUse& operator=(const EventsInUse&) = delete;

    [[nodiscard]] bool contains(std::string_view eventName);

private:
    struct Answer;
    static constexpr std::size_t kSlots = 8192;
    static constexpr std::size_t kMaximumAnswers = kSlots / 2;

    [[nodiscard]] bool workOut(std::string_view eventName, std::size_t slot, std::uint64_t generation);
    void readPatterns(std::uint64_t generation);
    [[nodiscard]] bool matches(std::string_view eventName) const noexcept;

    const LinuxPreferences& preferences_;
    StructuredLog& log_;
    /// Open addressing; a filled slot never changes.
    std::unique_ptr<std::atomic<Answer*>[]> slots_;

    std::mutex mutex_; ///< guards filling slots and what follows
    std::size_t answers_ = 0;
    std::uint64_t patternsGeneration_ = 0;
    bool allInUse_ = true;
    std::vector<std::string> names_; ///< sorted
    std::vector<std::string> prefixes_;
    std::optional<Value> reported_; ///< the malformed value that the log knows of
};

} // namespace tamblo
