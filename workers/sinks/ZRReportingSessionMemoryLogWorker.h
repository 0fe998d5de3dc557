#pragma once

#include "platform/Clock.h"
#include "session/ZRReportingSessionWorkerProtocol.h"

#include <optional>

namespace tamblo {

/// Has the memory log record what memory the session's processes, and those that a message names, hold when a
/// message asks for it, repeats included: the figures change while the question stays the same.
class ZRReportingSessionMemoryLogWorker final : public ZRReportingSessionWorkerConsumerProtocol {
public:
    using ZRReportingSessionWorkerConsumerProtocol::ZRReportingSessionWorkerConsumerProtocol;

    void handleMessage(const MessageRef& message) override;
    [[nodiscard]] bool handleRedundantMessages() const override { return true; }

private:
    std::optional<WallTime> lastLogged_;
};

} // namespace tamblo
