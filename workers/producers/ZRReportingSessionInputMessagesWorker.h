#pragma once

#include "base/UniqueFunction.h"
#include "session/ZRReportingSessionWorkerProtocol.h"

#include <chrono>
#include <vector>

namespace tamblo {

class Value;

/// Derives, when a session stops, one summary for each stretch of audio input on the same device: how long it
/// was, how the voice processing was set up, and which vocoders were used. Keeps nothing between stops.
class ZRReportingSessionInputMessagesWorker final : public ZRReportingSessionWorkerProducerProtocol {
public:
    using ZRReportingSessionWorkerProducerProtocol::ZRReportingSessionWorkerProducerProtocol;

    [[nodiscard]] bool stopSome() override;

    /// The summaries of the messages, which must not change meanwhile but for the bursts of spatial-audio
    /// settings that are folded in place. Without a process name, null, there are none.
    [[nodiscard]] std::vector<MessageRef>
    createInputMessages(const std::vector<MessageRef>& messages, const Value* process,
                        std::chrono::duration<double> minimumRunningtime) const;

private:
    UniqueFunction<bool()> stopLeft_; ///< of a stop that is under way
};

} // namespace tamblo
