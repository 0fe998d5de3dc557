#pragma once

#include "session/ZRReportingSessionWorkerProtocol.h"

namespace tamblo {

/// Submits a metric record for every issue that a detector reports, whatever is missing from the report.
class ZRReportingSessionQMXWorker final : public ZRReportingSessionWorkerConsumerProtocol {
public:
    using ZRReportingSessionWorkerConsumerProtocol::ZRReportingSessionWorkerConsumerProtocol;

    void handleMessage(const MessageRef& message) override;
};

} // namespace tamblo
