#include "workers/sinks/ZRReportingSessionEventryWorker.h"

#include "base/BoundedCache.h"
#include "base/Format.h"
#include "session/ZRReportingSession.h"
#include "util/AudioEvents.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <utility>

namespace tamblo {

namespace {

struct Event {
    std::string name;
    bool isInUse = false;
};

/// What a message of one kind becomes, in sessions of one service type.
struct Events {
    Event general;
    Event ofService;
    std::uint64_t generation = 0; ///< of the service's answers to which of them are in use
};

Events makeEvents(AnalyticsEventService& service, AudioServiceType serviceType, AudioEventCategory category,
                  AudioEventType type) {
    const std::uint64_t generation = service.inUseGeneration();
    const std::string categoryName = ZRReportingUtilityCategoryString(category);
    const std::string_view typeName = ZRReportingUtilityTypeString(type);
    const std::string_view serviceName = ZRReportingUtilityGenerateServiceNameFromServiceType(serviceType);
    const std::string general = formatted("com.vandra.tamblo.{}.{}", categoryName, typeName);
    const std::string ofService = formatted("com.vandra.{}.{}.{}", serviceName, categoryName, typeName);
    return {
        {general, service.isEventInUse(general)}, {ofService, service.isEventInUse(ofService)}, generation};
}

} // namespace

/// The events that sessions have of late, with the answers to whether they are in use.
class ZRReportingSessionEventryWorker::EventCache {
public:
    const Events& get(AnalyticsEventService& service, AudioServiceType serviceType,
                      AudioEventCategory category, AudioEventType type) {
        // Service types without a name are one; the key is then 54 bits, and never 0.
        constexpr std::uint64_t kNoName = 31;
        const std::uint64_t number = serviceType <= AudioServiceTypeSystemSounds ? serviceType : kNoName;
        const std::uint64_t key = ((number + 1) << 48U) | (std::uint64_t{category} << 16U) | type;
        const std::uint64_t generation = service.inUseGeneration();
        const Events* known =
            events_.find(key, [generation](const Events& events) { return events.generation == generation; });
        return known != nullptr ? *known : events_.put(key, makeEvents(service, serviceType, category, type));
    }

private:
    BoundedCache<Events> events_;
};

ZRReportingSessionEventryWorker::ZRReportingSessionEventryWorker(Context& context,
                                                                 std::weak_ptr<ZRReportingSession> session)
    : ZRReportingSessionWorkerConsumerProtocol(context, std::move(session)),
      cache_(context.shared<EventCache>()) {}

void ZRReportingSessionEventryWorker::handleMessage(const MessageRef& message) {
    const std::shared_ptr<ZRReportingSession> owner = session();
    if (owner == nullptr) {
        return;
    }
    AnalyticsEventService& service = *platform().analyticsEvents;
    const Events& events = cache_.get(service, owner->serviceType(), message->category(), message->type());
    std::array<std::string_view, 2> inUse;
    std::size_t count = 0;
    for (const Event* event : {&events.general, &events.ofService}) {
        if (event->isInUse) {
            inUse[count++] = event->name;
        }
    }
    if (count != 0) {
        service.sendEventsLazy(std::span(inUse).first(count), [&message] { return message->payload(); });
    }
}

} // namespace tamblo
