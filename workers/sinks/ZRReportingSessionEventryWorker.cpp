#include "workers/sinks/ZRReportingSessionEventryWorker.h"

#include "base/BoundedCache.h"
#include "base/Format.h"
#include "session/ZRReportingSession.h"
#include "util/AudioEvents.h"

#include <cstdint>
#include <utility>

namespace tamblo {

namespace {

struct EventNames {
    std::string general;
    std::string ofService;
};

EventNames makeEventNames(AudioServiceType serviceType, AudioEventCategory category, AudioEventType type) {
    const std::string categoryName = ZRReportingUtilityCategoryString(category);
    const std::string_view typeName = ZRReportingUtilityTypeString(type);
    const std::string_view serviceName = ZRReportingUtilityGenerateServiceNameFromServiceType(serviceType);
    return {formatted("com.vandra.tamblo.{}.{}", categoryName, typeName),
            formatted("com.vandra.{}.{}.{}", serviceName, categoryName, typeName)};
}

} // namespace

/// The names of the events that sessions have of late; the names of a device's events are few.
class ZRReportingSessionEventryWorker::EventNameCache {
public:
    const EventNames& get(AudioServiceType serviceType, AudioEventCategory category, AudioEventType type) {
        // Service types without a name are one; the key is then 54 bits, and never 0.
        constexpr std::uint64_t kNoName = 31;
        const std::uint64_t service = serviceType <= AudioServiceTypeSystemSounds ? serviceType : kNoName;
        const std::uint64_t key = ((service + 1) << 48U) | (std::uint64_t{category} << 16U) | type;
        return names_.get(key, [&] { return makeEventNames(serviceType, category, type); });
    }

private:
    BoundedCache<EventNames> names_;
};

ZRReportingSessionEventryWorker::ZRReportingSessionEventryWorker(Context& context,
                                                                 std::weak_ptr<ZRReportingSession> session)
    : ZRReportingSessionWorkerConsumerProtocol(context, std::move(session)),
      names_(context.shared<EventNameCache>()) {}

void ZRReportingSessionEventryWorker::handleMessage(const MessageRef& message) {
    const std::shared_ptr<ZRReportingSession> owner = session();
    if (owner == nullptr) {
        return;
    }
    const EventNames& names = names_.get(owner->serviceType(), message->category(), message->type());
    offer(names.general, *message);
    offer(names.ofService, *message);
}

void ZRReportingSessionEventryWorker::offer(const std::string& eventName,
                                            const ZRReportingSessionMessage& message) const {
    AnalyticsEventService& service = *platform().analyticsEvents;
    if (service.isEventInUse(eventName)) {
        service.sendEventLazy(eventName, [&message] { return message.payload(); });
    }
}

} // namespace tamblo
