#include "session/ZRReportingSessionMessage.h"

#include "base/KeyPlaces.h"
#include "util/Log.h"
#include "util/MessageKeys.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>
#include <string_view>

namespace tamblo {

namespace {

struct TimedMessage {
    double time;
    MessageRef message;
};

/// The time that each message sorts by.
std::vector<double> sortTimes(const std::vector<MessageRef>& messages) {
    static constexpr std::array<std::string_view, 1> kKeys{ZRReportingInternalEventEpochTime};
    KeyPlaces places(kKeys);
    std::vector<double> times;
    times.reserve(messages.size());
    for (const MessageRef& message : messages) {
        const Dictionary& payload = message->payload();
        const std::uint32_t place = places.in(payload.keys())[0];
        const double time = place != KeyPlaces::kAbsent ? payload.valueAt(place).doubleValue() : 0.0;
        times.push_back(std::isnan(time) ? 0.0 : time);
    }
    return times;
}

} // namespace

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
    const std::vector<double> times = sortTimes(messages);
    if (std::is_sorted(times.begin(), times.end())) {
        return false;
    }
    std::vector<TimedMessage> timed;
    timed.reserve(messages.size());
    for (std::size_t i = 0; i < messages.size(); ++i) {
        timed.push_back({times[i], std::move(messages[i])});
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
