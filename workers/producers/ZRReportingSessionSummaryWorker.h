#pragma once

#include "session/ZRReportingSessionWorkerProtocol.h"

#include <cstdint>
#include <memory>
#include <optional>

namespace tamblo {

/// Counts, while its session runs, how long the session's audio was active and how many overloads were
/// reported, and sends the session one summary of itself when it stops: activity, messages, who reported,
/// and the state of the device.
///
/// The counts go on over all runs of the session. A producer that is offered messages as well; its own
/// summary comes back to it and counts nothing.
class ZRReportingSessionSummaryWorker final : public ZRReportingSessionWorkerConsumerProtocol {
public:
    ZRReportingSessionSummaryWorker(Context& context, std::weak_ptr<ZRReportingSession> session);

    std::optional<bool> start() override { return true; }
    void handleMessage(const MessageRef& message) override;
    [[nodiscard]] bool stopSome() override;

private:
    struct Places;

    [[nodiscard]] Dictionary summaryOf(const ZRReportingSession& session) const;

    Places& places_;
    std::uint32_t activeCount_ = 0;
    std::uint32_t overloadCount_ = 0;
    double totalActiveTime_ = 0.0;
};

} // namespace tamblo
