#pragma once

#include "base/Mutex.h"
#include "platform/CallQualityService.h"
#include "platform/Clock.h"
#include "platform/WorkQueue.h"
#include "platform/linux/sinks/AppendOnlyFile.h"
#include "platform/linux/sinks/NamesPreference.h"

#include <atomic>
#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace tamblo {

/// The call-quality service as a spool, the file of JSON lines `call-quality.jsonl`:
///
///     {"time":…,"op":"open","session":"9f86d081884c7d65.1","sessionInfo":{…},"userInfo":{…}}
///     {"time":…,"op":"message","session":"9f86d081884c7d65.1","category":4,"type":1,"payload":{…}}
///     {"time":…,"op":"flush","session":"9f86d081884c7d65.1"}
///
/// No reply waits for the file. The messages of a session whose events are batched are held back, so that
/// those that come one by one share a write: for a quarter of a second, or until 64 KiB of lines wait, or a
/// session is made or flushed.
///
/// A session's name is one for the file's whole life: 64 random bits of the process, and a count. Which back
/// ends there are is a preference, domain `com.vandra.tamblo.callquality`, key `backends`; it is looked up on
/// a queue of the service's own, as looking for real ones would take its time.
class LinuxCallQualityService final : public CallQualityService {
public:
    /// What is referred to must outlive the service, except the queues, which are used from the first session
    /// on and work off what was posted before the service goes.
    LinuxCallQualityService(SinkFiles& sinks, const Clock& clock, const LinuxPreferences& preferences,
                            WorkQueues& workQueues, StructuredLog& log);

    [[nodiscard]] std::optional<std::string> NewHierarchyToken(std::string_view parent) override;
    [[nodiscard]] SessionRef CreateLinkmeterSession(const Dictionary& sessionInfo,
                                                    const Dictionary& userInfo) override;
    void StartConfiguration(const SessionRef& session, Completion completion) override;
    [[nodiscard]] std::optional<std::string> SendLinkmeterMessage(const SessionRef& session,
                                                                  std::uint16_t category, std::uint16_t type,
                                                                  const Dictionary& payload,
                                                                  std::string_view leftOut) override;
    [[nodiscard]] bool trySendLinkmeterMessage(const SessionRef& session, std::uint16_t category,
                                               std::uint16_t type, const Dictionary& payload,
                                               std::string_view leftOut) override;
    void FlushMessages(const SessionRef& session) override;

    /// At the end of each run of queues' work, since the sessions' queues are many: what may not be held back
    /// goes to the file. The answer is how long the rest may wait until `writeHeldBack`, once for all of it.
    [[nodiscard]] std::optional<std::chrono::milliseconds> endRun();
    void writeHeldBack();

private:
    class SpoolSession;

    void appendMessage(TextBuffer& lines, const SessionRef& session, std::uint16_t category,
                       std::uint16_t type, const Dictionary& payload, std::string_view leftOut);

    const std::string processName_;
    const Clock& clock_;
    WorkQueues& workQueues_;
    PayloadTexts& texts_;
    AppendOnlyFile file_;
    std::atomic<bool> isDue_{false};   ///< what waits for the file
    std::atomic<bool> isTimed_{false}; ///< there will be a `writeHeldBack`
    std::atomic<std::uint64_t> lastToken_{0};
    std::atomic<std::uint64_t> lastSession_{0};
    Mutex mutex_;
    std::unique_ptr<SerialQueue> queue_ TAMBLO_GUARDED_BY(mutex_);
    NamesPreference backends_; ///< the queue's
};

} // namespace tamblo
