// Any two texts as the states of a driver's statistics file, and what lies between them.

#include "Demand.h"
#include "platform/linux/drivers/ChanlogChannelJson.h"
#include "platform/linux/drivers/LinuxChanlogFacility.h"

#include <cstdint>
#include <variant>

namespace tamblo {
namespace {

using fuzz::demand;

void check(const ChanlogChannel& channel) {
    for (const auto* name : {&channel.driverName, &channel.groupName, &channel.subGroupName,
                             &channel.channelName, &channel.unitLabel}) {
        demand(!*name || (*name)->size() <= kMaximumChanlogNameLength);
    }
    demand(channel.states.size() <= kMaximumChanlogElements);
    demand(channel.buckets.size() <= kMaximumChanlogElements);
    for (const ChanlogState& state : channel.states) {
        demand(state.dutyCycle >= 0 && state.dutyCycle <= 1);
    }
}

void compare(std::string_view earlierText, std::string_view laterText) {
    static const fuzz::ScratchDirectory directory;
    static fuzz::SilentLog log;
    LinuxChanlogFacility facility(directory.path("channels"), log, directory.path("no sound"));
    directory.write("channels/driver.json", earlierText);
    const ChanlogChannels earlier = facility.readAll();
    // Another size: a change that is seen however soon it comes.
    directory.write("channels/driver.json", std::string(laterText) + (earlierText.size() % 2 ? " " : "  "));
    const ChanlogChannels later = facility.readAll();
    for (const ChanlogChannels& channels : {earlier, later}) {
        demand(channels != nullptr && channels->size() <= LinuxChanlogFacility::kMaximumChannels);
        for (const ChanlogChannelRef& channel : *channels) {
            check(*channel);
        }
        const auto none = facility.difference(channels, channels);
        demand(std::holds_alternative<ChanlogChannels>(none));
    }
    const auto gained = std::get<ChanlogChannels>(facility.difference(earlier, later));
    demand(gained->size() <= later->size());
    for (const ChanlogChannelRef& channel : *gained) {
        check(*channel);
    }
}

} // namespace
} // namespace tamblo

/// The two texts stand apart by a byte that no text has.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
    const std::string_view both(reinterpret_cast<const char*>(bytes), size);
    const std::size_t middle = both.find('\xFF');
    tamblo::compare(both.substr(0, middle), middle == both.npos ? both : both.substr(middle + 1));
    return 0;
}
