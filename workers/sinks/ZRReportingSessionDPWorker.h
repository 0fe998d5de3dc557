#pragma once

#include "session/ZRReportingSessionWorkerProtocol.h"

#include <cstdint>
#include <memory>
#include <string_view>

namespace tamblo {

/// Has the whole system's stacks sampled (a stackburst) when an application's audio overloads: on internal
/// builds, where a preference asks for it. The overload has to be of a buffer and an I/O cycle that are large
/// enough, and more than ten seconds after the last one that this worker had captured.
///
/// What is large enough, and how long to wait before the capture, are preferences, which the making of each
/// worker reads for all of them. The wait holds up the reporting server queue; where there is one, the
/// queue's work may block.
class ZRReportingSessionDPWorker final : public ZRReportingSessionWorkerConsumerProtocol {
public:
    ZRReportingSessionDPWorker(Context& context, std::weak_ptr<ZRReportingSession> session);
    /// Null where no captures are wanted.
    [[nodiscard]] static std::shared_ptr<ZRReportingSessionWorkerProtocol>
    initWithSession(Context& context, const std::shared_ptr<ZRReportingSession>& session);

    std::optional<bool> start() override { return true; }
    void handleMessage(const MessageRef& message) override;

    /// Whether it is an overload of the audio I/O itself: an error of that kind, without a subsystem.
    [[nodiscard]] static bool interestedInMessage(const ZRReportingSessionMessage& message);
    /// Preferences; false, 0 or 0.0 without a value.
    [[nodiscard]] static bool getEnableFlag(Context& context, std::string_view key);
    [[nodiscard]] static std::int32_t getRunTimeDefaults(Context& context, std::string_view key);
    [[nodiscard]] static double getDoubleRunTimeDefaults(Context& context, std::string_view key);

private:
    struct RunTimeValues;

    [[nodiscard]] bool isToBeCaptured(const Dictionary& payload, double now) const;
    void capture(ZRReportingSessionMessage& message, double now);

    const RunTimeValues& runTime_;
    double lastMessageTime_ = 0.0; ///< seconds since 1970, of the last capture; 0.0 before the first
};

} // namespace tamblo
