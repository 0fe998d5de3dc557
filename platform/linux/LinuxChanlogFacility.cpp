#include "platform/linux/LinuxChanlogFacility.h"

namespace tamblo {

std::variant<ChanlogChannels, int> LinuxChanlogFacility::channelsOf(const ChanlogSelection&) {
    return std::make_shared<const std::vector<ChanlogChannel>>();
}
std::variant<std::unique_ptr<ChanlogSubscription>, int>
LinuxChanlogFacility::subscribe(const ChanlogSelection&, const ChanlogChannels&) {
    return 1;
}
std::unique_ptr<ChanlogSampling> LinuxChanlogFacility::beginSampling() {
    return nullptr;
}
std::variant<ChanlogChannels, int> LinuxChanlogFacility::difference(const ChanlogChannels&,
                                                                    const ChanlogChannels&) {
    return 1;
}

} // namespace tamblo
