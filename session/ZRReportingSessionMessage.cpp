#include "session/ZRReportingSessionMessage.h"

#include "session/MessageSort.h"
#include "util/Log.h"

#include <algorithm>

namespace tamblo {

DestinationWorkers ZRReportingSessionMessage::destinationWorkers() const {
    return destinationWorkers_ != nullptr ? *destinationWorkers_ : DestinationWorkers{};
}

void ZRReportingSessionMessage::setDestinationWorkers(DestinationWorkers workers) {
    destinationWorkers_ =
        workers.empty() ? nullptr : std::make_unique<const DestinationWorkers>(std::move(workers));
}

bool ZRReportingSessionMessage::namesDestination(const WorkerClass& workerClass) const noexcept {
    return std::find(destinationWorkers_->begin(), destinationWorkers_->end(), &workerClass) !=
           destinationWorkers_->end();
}

MessageRef ZRReportingSessionMessage::copyWithZone() const {
    log::debug(ZRReportingSessionCategory(), "copyWithZone");
    auto copy = std::make_shared<ZRReportingSessionMessage>(message(), category_, type_);
    copy->isRedundant = isRedundant;
    copy->isSessionStarted = isSessionStarted;
    return copy;
}

std::string ZRReportingSessionMessage::description() const {
    return formatted("{}", *this);
}

bool ZRReportingSessionMessage::sortMessages(std::vector<MessageRef>& messages) {
    MessageSort sort(messages);
    while (!sort.sortSome()) {
    }
    return sort.hasChanged();
}

void appendText(std::string& out, const ZRReportingSessionMessage& message) {
    appendFormatted(out, "category={} type={} {}", ZRReportingUtilityCategoryString(message.category()),
                    ZRReportingUtilityTypeString(message.type()), message.message());
}

} // namespace tamblo
