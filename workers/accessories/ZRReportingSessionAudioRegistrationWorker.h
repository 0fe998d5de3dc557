#pragma once

#include "session/ZRReportingSessionWorkerProtocol.h"

#include <optional>

namespace tamblo {

/// Reports which wireless earbuds the device has, when a session starts: each accessory at most once in a
/// day, by its model, never by its address or name. A consumer by its role, it makes nothing of messages.
class ZRReportingSessionAudioRegistrationWorker final : public ZRReportingSessionWorkerConsumerProtocol {
public:
    using ZRReportingSessionWorkerConsumerProtocol::ZRReportingSessionWorkerConsumerProtocol;

    std::optional<bool> start() override;
    void handleMessage(const MessageRef&) override {}
};

} // namespace tamblo
