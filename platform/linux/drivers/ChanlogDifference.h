#pragma once

#include "platform/ChanlogFacility.h"
#include "platform/StructuredLog.h"

#include <cstddef>
#include <set>
#include <string>

namespace tamblo {

/// Works out what the channels of one sample have gained over those of an earlier one.
///
/// Values, transitions, residencies and hits subtract; a state's duty cycle is its share of the residency
/// gained; minimum and maximum are the later sample's. Channels are the same by driver, group, subgroup, name
/// and format, states by name, buckets by bounds; what only one sample has is left out. So is a state or
/// bucket one of whose counters has run backwards, and a channel whose value has moved by more than a 64-bit
/// number can tell, with one error line for the channel until all of it can be told again; a simple value may
/// fall. Not thread-safe.
class ChanlogDifference {
public:
    /// Channels whose trouble is remembered; beyond these all are forgotten and may be told anew.
    static constexpr std::size_t kMaximumTroubled = 4096;

    /// The log must outlive this.
    explicit ChanlogDifference(StructuredLog& log) : log_(log) {}

    /// In the later sample's order. Takes time proportional to the number of channels where the samples have
    /// them in the same order, a logarithm more where not.
    [[nodiscard]] ChanlogChannels between(const ChanlogChannels& earlier, const ChanlogChannels& later);

private:
    void report(const ChanlogChannel& channel, const char* trouble);

    StructuredLog& log_;
    std::set<std::string> troubled_;
};

} // namespace tamblo
