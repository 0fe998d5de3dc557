#pragma once

#include "base/Dictionary.h"
#include "base/Mutex.h"
#include "platform/AnalyticsEventService.h"
#include "platform/Clock.h"
#include "platform/linux/sinks/AppendOnlyFile.h"
#include "platform/linux/sinks/NamesPreference.h"
#include "platform/linux/sinks/PayloadTexts.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// The analytics-event service as a file of JSON lines, `analytics-events.jsonl`:
///
///     {"time":1772366400.25,"event":"com.vandra.tamblo.Session_Generic.Summary","payload":{…}}
///
/// Which events are in use is a preference, domain `com.vandra.tamblo.analytics`, key `events_in_use`: an
/// array of names, each exact or with one trailing `*`; without it all are.
class LinuxAnalyticsEventService final : public AnalyticsEventService {
public:
    /// What is referred to must outlive the service.
    LinuxAnalyticsEventService(SinkFiles& sinks, const Clock& clock, const LinuxPreferences& preferences,
                               StructuredLog& log);

    [[nodiscard]] bool isEventInUse(std::string_view eventName) override;
    [[nodiscard]] std::uint64_t inUseGeneration() const override { return preferences_.generation(); }
    void sendEventsLazy(std::span<const std::string_view> eventNames,
                        const std::function<Dictionary()>& payload) override;

private:
    void record(std::span<const std::string_view> eventNames, const std::function<Dictionary()>& payload);
    void readNamesInUse(std::uint64_t generation) TAMBLO_REQUIRES(mutex_);

    const Clock& clock_;
    const LinuxPreferences& preferences_;

    /// The generation of the preferences by which all events are in use: the usual case, without the lock.
    std::atomic<std::uint64_t> allInUseIn_{0};
    Mutex mutex_;
    NamesPreference preference_ TAMBLO_GUARDED_BY(mutex_);
    std::uint64_t generation_ TAMBLO_GUARDED_BY(mutex_) = 0;
    std::vector<std::string> names_ TAMBLO_GUARDED_BY(mutex_);    ///< sorted
    std::vector<std::string> prefixes_ TAMBLO_GUARDED_BY(mutex_); ///< sorted, none of another

    PayloadTexts& texts_;
    AppendOnlyFile file_;
};

} // namespace tamblo
