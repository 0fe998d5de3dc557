#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <variant>
#include <vector>

namespace tamblo {

/// What a channel's figures are. A facility may know more formats than these.
enum class ChanlogFormat : std::uint8_t {
    invalid = 0,
    simple = 1,
    state = 2,
    histogram = 3,
    simpleArray = 4
};

/// One state of a state channel.
struct ChanlogState {
    std::string name;
    std::uint64_t transitions = 0; ///< into the state
    std::uint64_t residency = 0;   ///< in the channel's unit
    double dutyCycle = 0;          ///< share of the residency of all states, 0 to 1; of a difference alone
};

/// One bucket of a histogram: how many values lay within its bounds.
struct ChanlogBucket {
    std::int64_t lower = 0;
    std::int64_t upper = 0;
    int boundsError = 0; ///< why the bounds could not be had, 0 otherwise
    std::int64_t hits = 0;
};

/// One driver statistics channel with its figures at one moment, or their difference between two.
struct ChanlogChannel {
    std::optional<std::string> driverName;
    std::optional<std::string> groupName;
    std::optional<std::string> subGroupName;
    std::optional<std::string> channelName;
    std::optional<std::string> unitLabel;
    ChanlogFormat format = ChanlogFormat::invalid;
    std::int64_t value = 0;             ///< simple
    std::vector<ChanlogState> states;   ///< state
    std::vector<ChanlogBucket> buckets; ///< histogram
    std::int64_t minimum = 0;           ///< histogram: the least value seen
    std::int64_t maximum = 0;           ///< histogram: the greatest
};

/// Immutable: samples between which a channel has not moved share it.
using ChanlogChannelRef = std::shared_ptr<const ChanlogChannel>;
/// Channels that belong together, immutable and cheap to copy. Null stands for a sample that was not taken.
using ChanlogChannels = std::shared_ptr<const std::vector<ChanlogChannelRef>>;

/// Which channels are meant: those of the group and subgroup; a name that is absent leaves any.
struct ChanlogSelection {
    std::optional<std::string> groupName;
    std::optional<std::string> subGroupName;
};

/// The channels of one selection, subscribed to. Owned by the subscriber, used by one thread at a time; ends
/// with this object, which may outlive its facility as long as it is not sampled.
class ChanlogSubscription {
public:
    virtual ~ChanlogSubscription() = default;
    /// The channels that were there when it was made.
    [[nodiscard]] virtual const ChanlogChannels& subscribedChannels() const = 0;
};

/// A moment at which the channels are looked at: what the calls have in common is read once, with the first
/// of them. Short-lived, used on one thread; its facility must outlive it.
///
/// What comes in place of channels is an error code, 0 when there is none to tell.
class ChanlogSampling {
public:
    virtual ~ChanlogSampling() = default;
    /// The channels that there are, none perhaps.
    [[nodiscard]] virtual std::variant<ChanlogChannels, int>
    channelsOf(const ChanlogSelection& selection) = 0;
    /// The figures of the subscription's channels.
    [[nodiscard]] virtual std::variant<ChanlogChannels, int> sample(ChanlogSubscription& subscription) = 0;
};

/// The driver-statistics channel facility. Any thread; may read files.
class ChanlogFacility {
public:
    virtual ~ChanlogFacility() = default;
    [[nodiscard]] virtual std::unique_ptr<ChanlogSampling> beginSampling() = 0;
    /// To channels that were found with this selection. Or an error code.
    [[nodiscard]] virtual std::variant<std::unique_ptr<ChanlogSubscription>, int>
    subscribe(const ChanlogSelection& selection, const ChanlogChannels& channels) = 0;
    /// What the later sample has gained over the earlier one, channel by channel; or an error code, as
    /// without an earlier one.
    [[nodiscard]] virtual std::variant<ChanlogChannels, int> difference(const ChanlogChannels& earlier,
                                                                        const ChanlogChannels& later) = 0;
};

} // namespace tamblo
