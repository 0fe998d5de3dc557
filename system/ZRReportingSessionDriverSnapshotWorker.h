#pragma once

#include "session/ZRReportingSessionWorkerProtocol.h"
#include "system/ZRReportingDriverUtility.h"

#include <optional>

namespace tamblo {

/// Samples the audio drivers' statistics when its session starts and again when it stops, and sends the
/// session what they have gained meanwhile. The samples themselves are the driver utility's business; a
/// worker holds the first one from start to stop.
class ZRReportingSessionDriverSnapshotWorker final : public ZRReportingSessionWorkerProducerProtocol {
public:
    using ZRReportingSessionWorkerProducerProtocol::ZRReportingSessionWorkerProducerProtocol;

    std::optional<bool> start() override;
    [[nodiscard]] bool stopSome() override;

private:
    [[nodiscard]] const ZRReportingDriverUtility& utility() const;

    std::optional<ZRReportingDriverUtility::DriverSnapShot> driverSnapShot_;
};

} // namespace tamblo
