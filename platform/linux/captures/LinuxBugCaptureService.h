#pragma once

#include "base/Mutex.h"
#include "platform/BugCaptureService.h"
#include "platform/Clock.h"
#include "platform/WorkQueue.h"
#include "platform/linux/captures/CaptureContent.h"
#include "platform/linux/captures/CaptureFolders.h"
#include "platform/linux/captures/DailyAllowance.h"
#include "platform/linux/log/LinuxStructuredLog.h"
#include "platform/linux/loop/LimitedQueue.h"
#include "platform/linux/sinks/AppendOnlyFile.h"

#include <atomic>
#include <chrono>
#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <string_view>

namespace tamblo {

/// The bug-capture service as a sink file, `bug-captures.jsonl`, and a directory with a folder for each
/// capture:
///
///     {"time":…,"op":"start","session":"20260301T…","signature":{…},"duration":60.0,"payload":{}}
///     {"time":…,"op":"end","session":"20260301T…"}
///
/// What a capture is made of is gathered on a queue of the service's own. A snapshot without a duration is
/// one line, written once its folder is complete, or could not be. A capture with one has its line at once,
/// and "end" when the duration is over and the folder is complete; one that is cancelled before, or still
/// runs when the service ends, has "cancel" instead and no folder.
class LinuxBugCaptureService final : public BugCaptureService {
public:
    /// A capture that runs longer tells nothing about what it was begun for; requests for one are refused.
    static constexpr std::chrono::hours kMaximumDuration{1};
    /// Pieces of work, two for each capture: those of two days, which may meet at midnight. One user may have
    /// them all, as what is dropped of a capture that was granted helps nobody: the day has no others.
    static constexpr std::size_t kMaximumWaiting = 4 * DailyAllowance::kCapturesADay;

    /// What is referred to must outlive the service, except the queues: before they go, `endSessions` is
    /// called.
    LinuxBugCaptureService(SinkFiles& sinks, const std::string& directory, const Clock& clock,
                           WorkQueues& workQueues, LinuxStructuredLog& log, FileModes modes = {},
                           const CaptureContent& content = CaptureContent());
    ~LinuxBugCaptureService() override { endSessions(); }

    [[nodiscard]] std::unique_ptr<GlarnReporter> makeReporter(std::span<const pid_t> processes) override;
    /// Whether the last capture's folder could not be written.
    [[nodiscard]] bool isOut() const noexcept { return folders_.isOut(); }
    /// Cancels the captures that run, and makes no others.
    void endSessions();

private:
    class Reporter;
    using RequestRef = std::shared_ptr<const CaptureRequest>;
    struct Running {
        RequestRef request;
        std::unique_ptr<DelayedCall> end;
    };

    [[nodiscard]] bool request(CaptureRequest request, const GlarnReporter::Reply& reply);
    [[nodiscard]] GlarnError admit(WallTime time);
    void run(const RequestRef& request);
    void cancel(const std::string& identifier);
    void finish(const std::string& identifier);
    [[nodiscard]] RequestRef takeRunning(const std::string& identifier);
    void gatherLater(const RequestRef& request);
    void gather(const CaptureRequest& request);
    void appendRequest(const CaptureRequest& request);
    void append(std::string_view operation, std::string_view identifier);

    const CaptureContent content_;
    const Clock& clock_;
    WorkQueues& workQueues_;
    LinuxStructuredLog& log_;
    AppendOnlyFile file_;
    CaptureFolders folders_; ///< the queue's
    DailyAllowance allowance_;
    /// Begins at random, so that captures of one millisecond differ across the service's starts, too.
    std::atomic<std::uint64_t> lastNumber_;

    Mutex mutex_;
    std::map<std::string, Running, std::less<>> running_ TAMBLO_GUARDED_BY(mutex_);
    bool isEnded_ TAMBLO_GUARDED_BY(mutex_) = false;

    LimitedQueue queue_;
};

} // namespace tamblo
