#include "util/ReportingUtilities.h"

#include "util/Context.h"
#include "util/MessageKeys.h"

#include <algorithm>
#include <cmath>
#include <limits>

namespace tamblo {

int roundedTo32Bits(double number) noexcept {
    constexpr double kLeast = std::numeric_limits<int>::min();
    constexpr double kMost = std::numeric_limits<int>::max();
    return static_cast<int>(std::clamp(std::round(number), kLeast, kMost));
}

bool ZRReportingUtilityKeyIsPresentAndHasChanged(std::string_view key, const Dictionary* first,
                                                 const Dictionary* second) noexcept {
    return first != nullptr && second != nullptr &&
           isPresentAndHasChanged(first->find(key), second->find(key));
}

double ZRReportingUtilityRoundWithPlaces(double value, int places) noexcept {
    const double scale = std::pow(10.0, places);
    return std::round(value * scale) / scale;
}

Dictionary ZRReportingUtilityAddDates(const Dictionary& message) {
    constexpr float kTicksPerSecond = 1'000'000;
    const Platform& device = Context::current().platform();
    const float ticks = static_cast<float>(device.processInformation->processorTime().count());
    Dictionary dated = message;
    dated.set(ZRReportingInternalEventEpochTime, secondsSince1970(device.clock->now()));
    dated.set(ZRReportingInternalEventSystemUptimeSec,
              roundedTo32Bits(device.processInformation->systemUptime().count()));
    dated.set(ZRReportingInternalEventProcessUptimeMS, roundedTo32Bits(ticks / kTicksPerSecond * 1000.0F));
    return dated;
}

} // namespace tamblo
