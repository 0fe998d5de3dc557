#pragma once

#include "platform/BugCaptureService.h"
#include "session/ZRReportingSessionWorkerProtocol.h"
#include "util/AudioEvents.h"
#include "workers/sinks/zeph/ZRReportingSessionZephWorkerInstance.h"

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// Watches the session's messages, repeats among them, for known audio problems, and has the device captured
/// when one was seen often or long enough. Internal builds only.
///
/// What a problem is, detectors know: the worker owns them, asks each about the messages of the one type that
/// it looks at, counts and decides when it fires. Detectors live as long as the worker; their counts last
/// over the session's stops, and those of leaks over sessions. All on the thread that does the session's
/// work; the capture service answers later, and to the detectors' states.
class ZRReportingSessionZephWorker final : public ZRReportingSessionWorkerConsumerProtocol {
public:
    using ZRReportingSessionWorkerConsumerProtocol::ZRReportingSessionWorkerConsumerProtocol;

    /// Null on a build that is not internal. The worker has the detectors of the session.
    [[nodiscard]] static std::shared_ptr<ZRReportingSessionWorkerProtocol>
    initWithSession(Context& context, const std::shared_ptr<ZRReportingSession>& session);
    /// Adds a detector behind the others, unless the class has none for such a session or refuses. The class
    /// must outlive the worker.
    void addInstance(const ZephWorkerInstanceClass& instanceClass);

    std::optional<bool> start() override;
    void handleMessage(const MessageRef& message) override;
    [[nodiscard]] bool handleRedundantMessages() const override { return true; }
    [[nodiscard]] bool stopSome() override;

    /// The capture session's identifier in a reply, or "NONE_RETURNED". Any thread.
    [[nodiscard]] static std::string getSessionIdentifierFromResponse(const Dictionary& response);
    /// What a capture for that message is filed under.
    [[nodiscard]] static BugCaptureSignature signatureFromMessage(const ZRReportingSessionMessage& message,
                                                                  AudioServiceType audioServiceType,
                                                                  std::string_view clientProcessName);

private:
    struct Instance {
        const ZephWorkerInstanceClass* instanceClass;
        std::unique_ptr<ZRReportingSessionZephWorkerInstance> detector;
    };

    void consider(const Instance& instance, const ZRReportingSessionMessage& message) const;

    std::vector<Instance> instances_;
};

} // namespace tamblo
