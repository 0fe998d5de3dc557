#pragma once

#include "base/UniqueFunction.h"
#include "session/ZRReportingSessionWorkerProtocol.h"

#include <chrono>
#include <vector>

namespace tamblo {

/// Derives, when a session stops, one summary for each stretch of output playback that took part in a shared
/// group session, in the same format and on the same devices throughout. Outside internal builds only the
/// analytics events and the summary file are to have them. Keeps nothing between stops.
class ZRReportingSessionKaleenMessagesWorker final : public ZRReportingSessionWorkerProducerProtocol {
public:
    using ZRReportingSessionWorkerProducerProtocol::ZRReportingSessionWorkerProducerProtocol;

    [[nodiscard]] bool stopSome() override;

    /// The summaries of the messages.
    [[nodiscard]] std::vector<MessageRef>
    createKaleenMessages(const std::vector<MessageRef>& messages,
                         std::chrono::duration<double> minimumPlaytime) const;

private:
    UniqueFunction<bool()> stopLeft_; ///< of a stop that is under way
};

} // namespace tamblo
