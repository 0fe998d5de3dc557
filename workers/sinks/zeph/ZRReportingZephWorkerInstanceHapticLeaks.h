#pragma once

#include "workers/sinks/zeph/ZRReportingSessionZephWorkerInstance.h"

#include <string_view>

namespace tamblo {

/// Has the device captured as it is when haptics hardware is held too long by clients that have forgotten
/// it. Counts over all sessions of the process.
class ZRReportingZephWorkerInstanceHapticLeaks final : public ZRReportingSessionZephWorkerInstance {
public:
    static constexpr std::string_view kClassName = "ZRReportingZephWorkerInstanceHapticLeaks";

    ZRReportingZephWorkerInstanceHapticLeaks(Context& context, std::weak_ptr<ZRReportingSession> session);

    [[nodiscard]] bool interestedInMessage(const ZRReportingSessionMessage& message) const override;
    [[nodiscard]] bool canFire() const noexcept override { return true; }
    void fire(const ZRReportingSessionMessage& message) override;
};

} // namespace tamblo
