#pragma once

#include "base/KeyPlaces.h"
#include "session/ZRReportingSessionMessage.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

namespace tamblo {

/// Folds bursts, message by message: a setting that a client reports in a few quick messages, each with one
/// of some related keys, becomes one message. A message counts under the first of the keys that it carries;
/// one with a key that the burst already has begins a new burst. The first message of a burst takes in the
/// payloads of those that follow it, each less than the pause after the one before, timestamps included; it
/// changes in place, in the session's list as well. Messages without any of the keys pass through.
///
/// The messages stay their owner's, in one list. At most 16 keys, which outlive this. For a session that
/// takes no messages any longer.
class RapidMessages {
public:
    RapidMessages(std::span<const std::string_view> keys, std::chrono::duration<double> maximumPause)
        : keyCount_(keys.size()), places_(keys), maximumPause_(maximumPause) {}

    /// Whether a message of these keys may belong to a burst; one of others need not be added.
    [[nodiscard]] bool concerns(const KeySet& keys) { return firstKeyOf(keys).has_value(); }
    /// Looks at the message at a place of the list, which ascends from call to call. When it was taken into
    /// an earlier one, the place of that, whose keys may be others then.
    std::optional<std::size_t> add(std::span<const MessageRef> messages, std::size_t place);

private:
    [[nodiscard]] std::optional<std::size_t> firstKeyOf(const KeySet& keys);

    const std::size_t keyCount_;
    KeyPlaces places_;
    const std::chrono::duration<double> maximumPause_;
    std::uint32_t seenKeys_ = 0;        ///< of the burst at hand
    std::optional<std::size_t> anchor_; ///< the place of what takes its others in
};

/// What several workers do with messages.
class ZRReportingSessionWorkerUtility {
public:
    ZRReportingSessionWorkerUtility() = delete;

    /// Folds the bursts among the messages.
    [[nodiscard]] static std::vector<ZRReportingSessionMessage*>
    combineRapidMessages(std::span<const MessageRef> messages,
                         std::span<const std::string_view> keysToCombine,
                         std::chrono::duration<double> maximumPausetime);
    /// Whether the payload carries an error key of a video call.
    [[nodiscard]] static bool isTalvixXYerrorMessage(const ZRReportingSessionMessage& message) noexcept;
};

} // namespace tamblo
