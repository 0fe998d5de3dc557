#pragma once

#include "session/ZRReportingSessionMessage.h"

#include <chrono>
#include <span>
#include <string_view>
#include <vector>

namespace tamblo {

/// What several workers do with messages.
class ZRReportingSessionWorkerUtility {
public:
    ZRReportingSessionWorkerUtility() = delete;

    /// Folds bursts: a setting that a client reports in a few quick messages, each with one of some related
    /// keys, becomes one message. A message counts under the first of the keys that it carries; one with a
    /// key that the burst already has begins a new burst. The first message of a burst takes in the payloads
    /// of those that follow it, each less than the pause after the one before, timestamps included; it
    /// changes in place, in the session's list as well. Messages without any of the keys pass through.
    ///
    /// The messages stay their owner's. At most 16 keys. For a session that takes no messages any longer.
    [[nodiscard]] static std::vector<ZRReportingSessionMessage*>
    combineRapidMessages(std::span<const MessageRef> messages,
                         std::span<const std::string_view> keysToCombine,
                         std::chrono::duration<double> maximumPausetime);
    /// Whether the payload carries an error key of a video call.
    [[nodiscard]] static bool isTalvixXYerrorMessage(const ZRReportingSessionMessage& message) noexcept;
};

} // namespace tamblo
