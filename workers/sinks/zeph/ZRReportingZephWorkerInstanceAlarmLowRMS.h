#pragma once

#include "workers/sinks/zeph/ZRReportingSessionZephWorkerInstance.h"

#include <chrono>

namespace tamblo {

/// Opens a capture session when an alarm plays at a level too low to be heard, once for each session. The
/// stop of the session cancels it, so that it is kept only when the session outlives it.
class ZRReportingZephWorkerInstanceAlarmLowRMS final : public ZRReportingSessionZephWorkerInstance {
public:
    ZRReportingZephWorkerInstanceAlarmLowRMS(Context& context, std::weak_ptr<ZRReportingSession> session);

    [[nodiscard]] bool interestedInMessage(const ZRReportingSessionMessage& message) const override;
    [[nodiscard]] bool canFire() const noexcept override { return true; }
    void fire(const ZRReportingSessionMessage& message) override;
    /// The identifier is kept: every later stop cancels again, which the capture service takes for nothing.
    void stop() override;

private:
    const std::chrono::duration<double> zephAlarmLowRmsDuration_{60.0};
};

} // namespace tamblo
