#include "workers/sinks/ZRReportingSessionRtcWorker.h"

#include "session/ZRReportingSession.h"

#include <algorithm>
#include <iterator>
#include <string>
#include <utility>
#include <vector>

namespace tamblo {

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
    std::string serviceName(owner->serviceName());
    if (!owner->isSingleMessageSession()) {
        serviceName += "_session";
    }
    agent_->start(
        {owner->reporterID(), owner->serviceType(), std::move(serviceName), owner->configuration()});
    return true;
}

void ZRReportingSessionRtcWorker::handleMessage(const MessageRef& message) {
    agent_->send({message->payload(), message->category(), message->type()});
}

void ZRReportingSessionRtcWorker::stop() {
    const std::shared_ptr<ZRReportingSession> owner = session();
    if (owner == nullptr) {
        return;
    }
    std::vector<MessageRef> messages;
    messages.reserve(owner->messages().size());
    std::transform(owner->messages().begin(), owner->messages().end(), std::back_inserter(messages),
                   [](const MessageRef& message) { return message->copyWithZone(); });
    agent_->stop(std::move(messages), owner->serviceType(), owner->reporterID());
}

} // namespace tamblo
