#pragma once

#include "session/ZRReportingSessionWorkerProtocol.h"

#include <memory>

namespace tamblo {

/// Offers every message that is not redundant to the analytics-event service, under two names: one of the
/// category and type, and one that adds the session's service name. The service decides which it wants; a
/// payload is handed over, as it stands then, only for a name that is in use.
class ZRReportingSessionEventryWorker final : public ZRReportingSessionWorkerConsumerProtocol {
public:
    ZRReportingSessionEventryWorker(Context& context, std::weak_ptr<ZRReportingSession> session);

    void handleMessage(const MessageRef& message) override;

private:
    class EventCache;

    EventCache& cache_;
};

} // namespace tamblo
