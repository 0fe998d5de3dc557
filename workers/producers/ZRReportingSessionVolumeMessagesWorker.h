#pragma once

#include "base/UniqueFunction.h"
#include "session/ZRReportingSessionWorkerProtocol.h"

#include <chrono>
#include <vector>

namespace tamblo {

class Value;

/// Derives, when a session stops, one summary for each stretch of output playback in which the playback
/// settings stayed the same: how long it was, at what volume, in what format, on which devices, with which
/// spatial-audio and ringer settings. Keeps nothing between stops.
class ZRReportingSessionVolumeMessagesWorker final : public ZRReportingSessionWorkerProducerProtocol {
public:
    using ZRReportingSessionWorkerProducerProtocol::ZRReportingSessionWorkerProducerProtocol;

    [[nodiscard]] bool stopSome() override;

    /// The summaries of the messages, which must not change meanwhile but for the bursts of spatial-audio
    /// settings that are folded in place. Without a process name, null, there are none.
    [[nodiscard]] std::vector<MessageRef>
    createVolumeMessages(const std::vector<MessageRef>& messages, const Value* process,
                         std::chrono::duration<double> minimumPlaytime) const;

private:
    UniqueFunction<bool()> stopLeft_; ///< of a stop that is under way
};

} // namespace tamblo
