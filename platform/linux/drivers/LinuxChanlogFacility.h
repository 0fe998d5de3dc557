#pragma once

#include "base/Mutex.h"
#include "platform/ChanlogFacility.h"
#include "platform/StructuredLog.h"
#include "platform/linux/drivers/ChanlogDifference.h"
#include "platform/linux/drivers/ChanlogFiles.h"
#include "platform/linux/drivers/ChanlogPcmStreams.h"

#include <cstddef>
#include <string>

namespace tamblo {

/// Driver statistics channels from files of the drivers' and from the kernel's PCM streams.
///
/// A subscription is to the selection: a sample has the channels that fit it at that moment, whether or not
/// they were there before. A channel that comes twice (the same driver, group, subgroup, name and format)
/// counts once: the first by the names of the files and the order in them, before the kernel's.
///
/// Nothing is read between samples. One takes some ten microseconds as long as no file has changed, whatever
/// the number of channels; a reading that changed nothing is shared with the one before it.
class LinuxChanlogFacility final : public ChanlogFacility {
public:
    /// Of both sources; those that are read last are left out.
    static constexpr std::size_t kMaximumChannels = 4096;

    /// The log must outlive the facility.
    LinuxChanlogFacility(std::string channelDirectory, StructuredLog& log,
                         std::string soundDirectory = "/proc/asound");

    [[nodiscard]] std::unique_ptr<ChanlogSampling> beginSampling() override;
    [[nodiscard]] std::variant<std::unique_ptr<ChanlogSubscription>, int>
    subscribe(const ChanlogSelection& selection, const ChanlogChannels& channels) override;
    /// Without an earlier sample, `ENOENT`.
    [[nodiscard]] std::variant<ChanlogChannels, int> difference(const ChanlogChannels& earlier,
                                                                const ChanlogChannels& later) override;

    /// All channels as they are now.
    [[nodiscard]] ChanlogChannels readAll();

private:
    [[nodiscard]] ChanlogChannels gather() TAMBLO_REQUIRES(mutex_);

    StructuredLog& log_;
    Mutex mutex_;
    ChanlogFiles files_ TAMBLO_GUARDED_BY(mutex_);
    ChanlogPcmStreams streams_ TAMBLO_GUARDED_BY(mutex_);
    ChanlogDifference difference_ TAMBLO_GUARDED_BY(mutex_);
    ChanlogChannels all_ TAMBLO_GUARDED_BY(mutex_); ///< as read last; null before
    bool isOverLimit_ TAMBLO_GUARDED_BY(mutex_) = false;
};

} // namespace tamblo
