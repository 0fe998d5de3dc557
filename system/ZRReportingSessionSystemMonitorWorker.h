#pragma once

#include "session/ZRReportingSessionWorkerProtocol.h"
#include "system/SystemMonitorDictionary.h"

#include <memory>
#include <optional>
#include <string_view>
#include <vector>

namespace tamblo {

/// Tells a session of the device's features: at its start the state of each that has one, from then on every
/// state that the system monitor stores, each as a message of the session's own.
///
/// It keeps the snapshot that it found when it was made, though the monitor be reset. Stores happen on the
/// reporting server queue, with the snapshot's lock held, and so do the messages. Dropping a worker that was
/// not stopped ends its observations.
class ZRReportingSessionSystemMonitorWorker final : public ZRReportingSessionWorkerProducerProtocol,
                                                    public SystemMonitorDictionary::KeyObserver {
public:
    ZRReportingSessionSystemMonitorWorker(Context& context, std::weak_ptr<ZRReportingSession> session);

    std::optional<bool> start() override;
    [[nodiscard]] bool stopSome() override;
    void keyValueChanged(std::string_view key) override;

private:
    /// Sends a feature's state; an empty one is not sent.
    void handleChange(Dictionary featureState) const;

    const std::shared_ptr<SystemMonitorDictionary> systemMonitorDictionary_; ///< null without a monitor
    const std::vector<std::string_view> featureKeys_;
    std::vector<SystemMonitorDictionary::Observation> observations_;
};

} // namespace tamblo
