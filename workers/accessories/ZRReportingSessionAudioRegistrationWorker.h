#pragma once

#include "session/ZRReportingSessionWorkerProtocol.h"

#include <memory>
#include <optional>
#include <string_view>

namespace tamblo {

/// Reports which wireless earbuds the device has, when a session starts and daily while any lasts: each
/// accessory at most once in a day, by its model, never by its address or name. A consumer by its role, it
/// makes nothing of messages.
///
/// Nothing is looked up when nobody wants the event, when the last lookup of any session was within a minute,
/// or while one is under way: thousands of sessions may start in a moment. The lookup reads files on another
/// thread, and its events are sent on the reporting server queue, so that they are written out with its
/// batch. It outlives the session.
class ZRReportingSessionAudioRegistrationWorker final : public ZRReportingSessionWorkerConsumerProtocol {
public:
    static constexpr std::string_view kEvent = "com.vandra.tamblo.accessoryregistration";

    ZRReportingSessionAudioRegistrationWorker(Context& context, std::weak_ptr<ZRReportingSession> session);
    ~ZRReportingSessionAudioRegistrationWorker() override;

    std::optional<bool> start() override;
    [[nodiscard]] bool stopSome() override;
    void handleMessage(const MessageRef&) override {}

private:
    struct Lookups;

    void leave();

    Lookups& lookups_;
    bool isCounted_ = false; ///< among the sessions that are started
};

} // namespace tamblo
