#pragma once

#include "workers/sinks/zeph/ZRReportingSessionZephWorkerInstance.h"

#include <string_view>

namespace tamblo {

/// Has the device captured as it is when a sound of the system-sound server is stuck. Counts over all
/// sessions of the process; as every message fires, captures are kept apart by a time.
class ZRReportingZephWorkerInstanceSSSLeaks final : public ZRReportingSessionZephWorkerInstance {
public:
    static constexpr std::string_view kClassName = "ZRReportingZephWorkerInstanceSSSLeaks";

    ZRReportingZephWorkerInstanceSSSLeaks(Context& context, std::weak_ptr<ZRReportingSession> session);

    [[nodiscard]] bool interestedInMessage(const ZRReportingSessionMessage& message) const override;
    [[nodiscard]] bool canFire() const noexcept override { return true; }
    void fire(const ZRReportingSessionMessage& message) override;
};

} // namespace tamblo
