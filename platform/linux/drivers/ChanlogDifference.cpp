#include "platform/linux/drivers/ChanlogDifference.h"

#include "base/Format.h"
#include "platform/Counters.h"

#include <algorithm>
#include <memory>
#include <tuple>
#include <vector>

namespace tamblo {

namespace {

/// What of a channel's gain cannot be told; null when all can.
using Trouble = const char*;
constexpr Trouble kBackwards = "a counter has run backwards; the states or buckets with such are left out "
                               "until they have risen from one sample to the next";
constexpr Trouble kOverflow = "the value has moved by more than a 64-bit number can tell; it is left out";

auto keyOf(const ChanlogChannelRef& channel) noexcept {
    return std::tie(channel->channelName, channel->subGroupName, channel->groupName, channel->driverName,
                    channel->format);
}
auto keyOf(const ChanlogState& state) noexcept {
    return std::tie(state.name);
}
auto keyOf(const ChanlogBucket& bucket) noexcept {
    return std::tie(bucket.lower, bucket.upper);
}

/// Finds things of a later list in the earlier one. They mostly stand at the same place; an index is made
/// once one does not.
template <typename Item> class Counterparts {
public:
    explicit Counterparts(const std::vector<Item>& items) : items_(items) {}

    /// Of an item at a place of the later list. Null without one; of several, the first.
    const Item* of(const Item& item, std::size_t place) {
        if (place < items_.size() && keyOf(items_[place]) == keyOf(item)) {
            return &items_[place];
        }
        const auto found = std::lower_bound(
            index().begin(), index().end(), item,
            [](const Item* indexed, const Item& wanted) { return keyOf(*indexed) < keyOf(wanted); });
        return found != index().end() && keyOf(**found) == keyOf(item) ? *found : nullptr;
    }

private:
    const std::vector<const Item*>& index() {
        if (index_.empty() && !items_.empty()) {
            index_.reserve(items_.size());
            for (const Item& item : items_) {
                index_.push_back(&item);
            }
            std::stable_sort(index_.begin(), index_.end(), [](const Item* left, const Item* right) {
                return keyOf(*left) < keyOf(*right);
            });
        }
        return index_;
    }

    const std::vector<Item>& items_;
    std::vector<const Item*> index_;
};

Trouble subtractStates(const ChanlogChannel& earlier, const ChanlogChannel& later, ChanlogChannel& gained) {
    Counterparts<ChanlogState> before(earlier.states);
    Trouble trouble = nullptr;
    double residency = 0;
    gained.states.reserve(later.states.size());
    for (std::size_t i = 0; i < later.states.size(); ++i) {
        const ChanlogState& now = later.states[i];
        const ChanlogState* then = before.of(now, i);
        if (then == nullptr) {
            continue;
        }
        if (now.transitions < then->transitions || now.residency < then->residency) {
            trouble = kBackwards;
            continue;
        }
        gained.states.push_back({.name = now.name,
                                 .transitions = now.transitions - then->transitions,
                                 .residency = now.residency - then->residency});
        residency += static_cast<double>(gained.states.back().residency);
    }
    for (ChanlogState& state : gained.states) {
        state.dutyCycle = residency > 0 ? static_cast<double>(state.residency) / residency : 0;
    }
    return trouble;
}

Trouble subtractBuckets(const ChanlogChannel& earlier, const ChanlogChannel& later, ChanlogChannel& gained) {
    Counterparts<ChanlogBucket> before(earlier.buckets);
    Trouble trouble = nullptr;
    gained.buckets.reserve(later.buckets.size());
    for (std::size_t i = 0; i < later.buckets.size(); ++i) {
        ChanlogBucket now = later.buckets[i];
        const ChanlogBucket* then = before.of(now, i);
        if (then == nullptr) {
            continue;
        }
        if (now.hits < then->hits) { // neither is negative
            trouble = kBackwards;
            continue;
        }
        now.hits -= then->hits;
        gained.buckets.push_back(now);
    }
    return trouble;
}

Trouble subtract(const ChanlogChannel& earlier, const ChanlogChannel& later, ChanlogChannel& gained) {
    gained.driverName = later.driverName;
    gained.groupName = later.groupName;
    gained.subGroupName = later.subGroupName;
    gained.channelName = later.channelName;
    gained.unitLabel = later.unitLabel;
    gained.format = later.format;
    gained.minimum = later.minimum;
    gained.maximum = later.maximum;
    if (__builtin_sub_overflow(later.value, earlier.value, &gained.value)) {
        return kOverflow;
    }
    const Trouble ofStates = subtractStates(earlier, later, gained);
    const Trouble ofBuckets = subtractBuckets(earlier, later, gained);
    return ofStates != nullptr ? ofStates : ofBuckets;
}

std::string nameOf(const ChanlogChannel& channel) {
    std::string name;
    for (const auto* part :
         {&channel.driverName, &channel.groupName, &channel.subGroupName, &channel.channelName}) {
        appendFormatted(name, "{}{}", name.empty() ? "" : "/", part->value_or("(null)"));
    }
    return name;
}

} // namespace

ChanlogChannels ChanlogDifference::between(const ChanlogChannels& earlier, const ChanlogChannels& later) {
    auto channels = std::make_shared<std::vector<ChanlogChannelRef>>();
    channels->reserve(later->size());
    Counterparts<ChanlogChannelRef> before(*earlier);
    for (std::size_t i = 0; i < later->size(); ++i) {
        const ChanlogChannelRef& now = (*later)[i];
        const ChanlogChannelRef* then = before.of(now, i);
        if (then == nullptr) {
            continue;
        }
        auto gained = std::make_shared<ChanlogChannel>();
        const Trouble trouble = subtract(**then, *now, *gained);
        counters::add(counters::Counter::driverDifferences, trouble != nullptr ? 1 : 0);
        if (trouble != nullptr || !troubled_.empty()) {
            report(*now, trouble);
        }
        if (trouble != kOverflow) {
            channels->push_back(std::move(gained));
        }
    }
    return channels;
}

void ChanlogDifference::report(const ChanlogChannel& channel, const char* trouble) {
    std::string name = nameOf(channel);
    if (trouble == nullptr) {
        troubled_.erase(name);
        return;
    }
    if (troubled_.size() >= kMaximumTroubled) {
        troubled_.clear();
    }
    const auto [place, isNew] = troubled_.insert(std::move(name));
    if (isNew) {
        log_.report(LogLevel::error, "zrrd", formatted("channel {}: {}", *place, trouble));
    }
}

} // namespace tamblo
