#pragma once

#include "session/ZRReportingSessionWorkerProtocol.h"

#include <string_view>

namespace tamblo {

/// Turns messages on the use of the haptic engine into events of the power-event log, which thus knows the
/// application behind the power. One message may be several events.
class ZRReportingSessionJouleryWorker final : public ZRReportingSessionWorkerConsumerProtocol {
public:
    using ZRReportingSessionWorkerConsumerProtocol::ZRReportingSessionWorkerConsumerProtocol;

    void handleMessage(const MessageRef& message) override;

private:
    /// Each posts its event when the payload has the key that it is about.
    void handleEngineOnDurationMessage(const Dictionary& payload) const;
    void handleEngineStateMessage(const Dictionary& payload) const;
    void handleLongRunningMessage(const Dictionary& payload) const;
};

} // namespace tamblo
