#include "workers/sinks/ZRReportingSessionRtcWorker.h"

#include "session/ZRReportingSession.h"
#include "util/MessageKeys.h"

#include <algorithm>
#include <cstddef>
#include <string>
#include <utility>
#include <vector>

namespace tamblo {

namespace {

constexpr int kClientType = 19;
constexpr float kClientVersion = 2.1F;
constexpr std::string_view kClientName = "com.vandra.tamblo";
constexpr std::string_view kSessionIDKey = "ZRReportingSessionID";

/// But for the token.
Dictionary sessionInfo(const ZRReportingSession& session) {
    const bool shouldBatch =
        ZRReportingSessionRtcWorker::shouldBatchLinkmeterEventsForServiceType(session.serviceType());
    Dictionary info{{linkmeter::ClientType, kClientType},
                    {linkmeter::ClientVersion, kClientVersion},
                    {linkmeter::SessionID, session.reporterID()},
                    {linkmeter::BatchEvent, shouldBatch},
                    {linkmeter::ContainsRealtimeEvents, !shouldBatch}};
    if (const Value* name = session.configuration().find(ZRReportingApplicationName)) {
        info.set(linkmeter::ClientBundleID, *name);
    }
    return info;
}

Dictionary userInfo(const ZRReportingSession& session) {
    const std::string serviceName(session.serviceName());
    Dictionary info{
        {linkmeter::ClientName, kClientName},
        {kSessionIDKey, session.reporterID()},
        {linkmeter::ServiceName, session.isSingleMessageSession() ? serviceName : serviceName + "_session"}};
    info.merge(session.configuration());
    return info;
}

} // namespace

std::shared_ptr<ZRReportingSessionWorkerProtocol>
ZRReportingSessionRtcWorker::initWithSession(Context& context,
                                             const std::shared_ptr<ZRReportingSession>& session) {
    if (session->serviceType() == AudioServiceTypeTest) {
        return nullptr;
    }
    return std::make_shared<ZRReportingSessionRtcWorker>(context, session);
}

std::optional<bool> ZRReportingSessionRtcWorker::start() {
    const std::shared_ptr<ZRReportingSession> owner = session();
    if (owner == nullptr || owner->serviceType() == AudioServiceTypeTest) {
        return false;
    }
    agent_->start(sessionInfo(*owner), userInfo(*owner));
    return true;
}

void ZRReportingSessionRtcWorker::handleMessage(const MessageRef& message) {
    agent_->send(message->payload(), message->category(), message->type());
}

bool ZRReportingSessionRtcWorker::stopSome() {
    constexpr std::size_t kMessagesOfPart = 20'000;
    const std::shared_ptr<ZRReportingSession> owner = session();
    if (owner == nullptr) {
        return true;
    }
    const std::vector<MessageRef>& messages = owner->messages();
    payloads_.reserve(messages.size());
    for (const std::size_t end = std::min(messages.size(), looked_ + kMessagesOfPart); looked_ < end;
         ++looked_) {
        const ZRReportingSessionMessage& message = *messages[looked_];
        if (message.isSessionStarted && !message.isRedundant) {
            payloads_.push_back(message.payload());
        }
    }
    if (looked_ < messages.size()) {
        return false;
    }
    looked_ = 0;
    agent_->stop(messages.empty() ? std::nullopt : std::optional(std::exchange(payloads_, {})),
                 owner->serviceType(), owner->reporterID());
    return true;
}

} // namespace tamblo
