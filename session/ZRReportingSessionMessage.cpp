#include "session/ZRReportingSessionMessage.h"

#include "session/MessageIntake.h"
#include "util/Log.h"

#include <algorithm>
#include <cmath>
#include <cstddef>

namespace tamblo {

namespace {

struct TimedMessage {
    double time;
    MessageRef message;
};

double sortTime(const ZRReportingSessionMessage& message) noexcept {
    const double time = intake::epochTime(message.payload());
    return std::isnan(time) ? 0.0 : time;
}

bool isSorted(const std::vector<MessageRef>& messages) noexcept {
    for (std::size_t i = 1; i < messages.size(); ++i) {
        if (sortTime(*messages[i]) < sortTime(*messages[i - 1])) {
            return false;
        }
    }
    return true;
}

} // namespace

Dictionary ZRReportingSessionMessage::message() const noexcept {
    const std::lock_guard held(lock_);
    return message_;
}

void ZRReportingSessionMessage::setMessage(Dictionary message) noexcept {
    const std::lock_guard held(lock_);
    // The old payload leaves with the argument, after the lock.
    std::swap(message_, message);
}

DestinationWorkers ZRReportingSessionMessage::destinationWorkers() const {
    const std::lock_guard held(lock_);
    return destinationWorkers_ != nullptr ? *destinationWorkers_ : DestinationWorkers{};
}

void ZRReportingSessionMessage::setDestinationWorkers(DestinationWorkers workers) {
    std::unique_ptr<const DestinationWorkers> replacement;
    if (!workers.empty()) {
        replacement = std::make_unique<const DestinationWorkers>(std::move(workers));
    }
    const std::lock_guard held(lock_);
    std::swap(destinationWorkers_, replacement);
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
    std::string text;
    appendText(text, *this);
    return text;
}

bool ZRReportingSessionMessage::sortMessages(std::vector<MessageRef>& messages) {
    if (isSorted(messages)) {
        return false;
    }
    std::vector<TimedMessage> timed;
    timed.reserve(messages.size());
    for (MessageRef& message : messages) {
        const double time = sortTime(*message);
        timed.push_back({time, std::move(message)});
    }
    std::stable_sort(timed.begin(), timed.end(),
                     [](const TimedMessage& a, const TimedMessage& b) { return a.time < b.time; });
    std::transform(timed.begin(), timed.end(), messages.begin(),
                   [](TimedMessage& entry) { return std::move(entry.message); });
    return true;
}

void appendText(std::string& out, const ZRReportingSessionMessage& message) {
    appendFormatted(out, "category={} type={} {}", ZRReportingUtilityCategoryString(message.category()),
                    ZRReportingUtilityTypeString(message.type()), message.message());
}

} // namespace tamblo
