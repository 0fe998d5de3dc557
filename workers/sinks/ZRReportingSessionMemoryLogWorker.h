#pragma once

#include "platform/Clock.h"
#include "session/ZRReportingSessionWorkerProtocol.h"

#include <chrono>
#include <optional>

namespace tamblo {

/// Has the memory log record what memory the session's processes, and those that a message names, hold when a
/// message asks for it, repeats included: the figures change while the question stays the same.
class ZRReportingSessionMemoryLogWorker final : public ZRReportingSessionWorkerConsumerProtocol {
public:
    using ZRReportingSessionWorkerConsumerProtocol::ZRReportingSessionWorkerConsumerProtocol;

    /// Messages that come sooner after a recorded one are left out.
    static constexpr std::chrono::seconds kLeastInterval{1};

    void handleMessage(const MessageRef& message) override;
    [[nodiscard]] bool handleRedundantMessages() const override { return true; }

private:
    /// Whether enough time has passed. A clock that was set back counts as that.
    [[nodiscard]] bool isDue(WallTime now) const noexcept;

    std::optional<WallTime> lastLogged_;
};

} // namespace tamblo
