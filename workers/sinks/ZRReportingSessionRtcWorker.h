#pragma once

#include "session/ZRReportingSessionWorkerProtocol.h"
#include "util/AudioEvents.h"
#include "workers/sinks/LinkmeterAgent.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <vector>

namespace tamblo {

/// Hands the messages of a started session to the call-quality service, in a session of that service's own,
/// and at the stop one summary of every key that those held that were sent while the session was started and
/// are no repeats, wherever they were destined.
///
/// Here is only taken what the work needs; it is done on a queue of the worker's own, which its agent keeps
/// and on which setting up may take seconds. A session started again sets up anew.
class ZRReportingSessionRtcWorker final : public ZRReportingSessionWorkerConsumerProtocol {
public:
    /// None for a session of the service type "test".
    [[nodiscard]] static std::shared_ptr<ZRReportingSessionWorkerProtocol>
    initWithSession(Context& context, const std::shared_ptr<ZRReportingSession>& session);
    using ZRReportingSessionWorkerConsumerProtocol::ZRReportingSessionWorkerConsumerProtocol;
    ~ZRReportingSessionRtcWorker() override { agent_->abandon(); }

    /// The category's kind.
    [[nodiscard]] static constexpr std::uint16_t
    retrieveLinkmeterCategoryFromCategory(AudioEventCategory category) noexcept {
        return static_cast<std::uint16_t>(category);
    }
    [[nodiscard]] static constexpr bool
    shouldBatchLinkmeterEventsForServiceType(AudioServiceType serviceType) noexcept {
        return serviceType != AudioServiceTypeAPIUsage;
    }
    std::optional<bool> start() override;
    void handleMessage(const MessageRef& message) override;
    [[nodiscard]] bool stopSome() override;

private:
    /// Of a stop that is under way: what the summary is of, and how many of the messages were looked at.
    std::vector<Dictionary> payloads_;
    std::size_t looked_ = 0;

    const std::shared_ptr<LinkmeterAgent> agent_ = std::make_shared<LinkmeterAgent>(context());
};

} // namespace tamblo
