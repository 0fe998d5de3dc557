#pragma once

#include "platform/ChanlogFacility.h"
#include "platform/StructuredLog.h"

#include <string>

namespace tamblo {

/// Driver statistics channels from files of the drivers' and from the kernel's PCM streams.
class LinuxChanlogFacility final : public ChanlogFacility {
public:
    /// The log must outlive the facility.
    LinuxChanlogFacility(std::string channelDirectory, StructuredLog& log,
                         std::string soundDirectory = "/proc/asound")
        : channelDirectory_(std::move(channelDirectory)),
          soundDirectory_(std::move(soundDirectory)),
          log_(log) {}

    [[nodiscard]] std::variant<ChanlogChannels, int> channelsOf(const ChanlogSelection& selection) override;
    [[nodiscard]] std::variant<std::unique_ptr<ChanlogSubscription>, int>
    subscribe(const ChanlogSelection& selection, const ChanlogChannels& channels) override;
    [[nodiscard]] std::unique_ptr<ChanlogSampling> beginSampling() override;
    [[nodiscard]] std::variant<ChanlogChannels, int> difference(const ChanlogChannels& earlier,
                                                                const ChanlogChannels& later) override;

private:
    const std::string channelDirectory_;
    const std::string soundDirectory_;
    StructuredLog& log_;
};

} // namespace tamblo
