#pragma once

#include "platform/ChanlogFacility.h"
#include "platform/StructuredLog.h"

#include <cstddef>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo {

/// The kernel's PCM streams as channels, from its files in `/proc/asound`: `pcm` lists the devices and how
/// many streams each has, `cardN/pcmDp/subS/status` tells of one stream (`c` in place of `p`: capture).
///
/// The driver is the card's id; the group "Tx" for playback, "Rx" for capture; the subgroup `pcm0p`, with
/// ` sub1` behind it for a further stream of the same device. All are simple channels, and all are 0 while
/// the stream is closed, so that a machine with sound always has the groups:
///
/// - `frames`: how far the hardware has come since the stream was opened. The count begins anew with every
///   opening, so that what a stream gains across one is less than what it played, or below 0.
/// - `overruns`: 1 while the stream stands still after an overrun or, in playback, an underrun. The kernel
///   does not count them: one that the application has recovered from leaves no trace.
/// - `available`, `delay`: levels at that moment; what they gain is by how much they have grown.
///
/// A figure or a stream that cannot be read has no channel, and is no error. Not thread-safe.
class ChanlogPcmStreams {
public:
    static constexpr std::size_t kMaximumStreams = 256;          ///< each is a file to read
    static constexpr std::size_t kMaximumListSize = 64U << 10U;  ///< bytes
    static constexpr std::size_t kMaximumStatusSize = 4U << 10U; ///< bytes

    explicit ChanlogPcmStreams(std::string soundDirectory) : soundDirectory_(std::move(soundDirectory)) {}

    /// Reads all streams; whether a figure has changed.
    [[nodiscard]] bool read(StructuredLog& log);
    void appendTo(std::vector<ChanlogChannelRef>& channels) const;

private:
    struct Stream {
        std::string statusFile;
        std::string driver;
        std::string group;
        std::string subGroup;
        std::string status = {}; ///< as read last
        std::vector<ChanlogChannelRef> channels = {};

        bool read();
    };

    void list(StructuredLog& log);
    void addStreams(std::string_view line);

    const std::string soundDirectory_;
    std::string listed_; ///< the list that the streams are from
    int listError_ = 0;
    std::vector<Stream> streams_;
};

} // namespace tamblo
