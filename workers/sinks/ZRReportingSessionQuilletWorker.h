#pragma once

#include "platform/BugReportDraftingService.h"
#include "session/ZRReportingSessionWorkerProtocol.h"

#include <chrono>
#include <memory>
#include <string_view>

namespace tamblo {

/// Offers the user a prepared bug report when a video call has handed the audio layer invalid coordinates: at
/// most once in a run of the session, and at most once in a back-off period on the whole device, which the
/// preferences remember. On internal builds, where a preference names the period.
///
/// A session's first message arms the worker: it looks at messages from five seconds after that one on. The
/// period begins when a message is of interest, before the draft is asked for, so that one that fails is not
/// asked for again. Storing its beginning may wait for a disk and is done on another queue; the draft, and
/// the reply to the message, come when that is done.
class ZRReportingSessionQuilletWorker final : public ZRReportingSessionWorkerConsumerProtocol {
public:
    ZRReportingSessionQuilletWorker(Context& context, std::weak_ptr<ZRReportingSession> session,
                                    std::chrono::duration<double> backOffTime);
    /// Null where no drafts are wanted.
    [[nodiscard]] static std::shared_ptr<ZRReportingSessionWorkerProtocol>
    initWithSession(Context& context, const std::shared_ptr<ZRReportingSession>& session);

    void handleMessage(const MessageRef& message) override;
    /// The next run of the session may have a draft again.
    [[nodiscard]] bool stopSome() override;

    /// Whether the message is worth a draft. Arms the worker, or begins the back-off period.
    [[nodiscard]] bool interestedInMessage(const ZRReportingSessionMessage& message);
    /// Whether the time that is stored under the key is less than the back-off ago. If it is not, now takes
    /// its place: at once for all sessions, and a moment later in the preferences.
    [[nodiscard]] bool hasRunInTimeframe(std::chrono::duration<double> backOff, std::string_view defaultsKey);
    [[nodiscard]] static BugReportDraft tikletDraftForTalvixXYerror();

private:
    struct Beginnings;

    Beginnings& beginnings_;
    const std::chrono::duration<double> backOffTime_;
    double minimumMessageTime_ = -1.0; ///< seconds since 1970; armed when above 0
    bool hasRun_ = false;
};

} // namespace tamblo
