#pragma once

#include "base/KeyPlaces.h"
#include "session/ZRReportingSessionMessage.h"

#include <cstddef>
#include <cstdint>
#include <utility>
#include <vector>

namespace tamblo {

/// Sorts messages by epoch time, stably, a part at a time; a time that is not a number counts as 0. Nobody
/// may look at the list meanwhile.
class MessageSort {
public:
    /// Messages lie all over the memory: who goes through them calls for the one so far ahead.
    static constexpr std::size_t kLookAhead = 8;

    explicit MessageSort(std::vector<MessageRef>& messages);

    /// Does the next part, of some milliseconds. Whether all is done.
    [[nodiscard]] bool sortSome();
    /// Whether the order changed, once all is done.
    [[nodiscard]] bool hasChanged() const noexcept { return hasChanged_; }
    /// The key set of each message, in their order, once all is done.
    [[nodiscard]] std::vector<const KeySet*> takeKeySets() noexcept { return std::move(keySets_); }

private:
    /// Messages whose times are read in one part.
    static constexpr std::size_t kMessagesRead = 8'192;
    /// Those that are sorted among themselves.
    static constexpr std::size_t kMessagesOfRun = 8'192;
    /// Those that are merged, or put into their order.
    static constexpr std::size_t kPlacesOfPart = 32'768;

    struct Place {
        double time;
        std::uint32_t index;
    };

    void readTimes();
    void sortRun();
    void mergeSome();
    void reorderSome();

    std::vector<MessageRef>& messages_;
    KeyPlaces keyPlaces_;
    std::vector<Place> places_;
    bool isSorted_ = true; ///< as far as was read
    bool hasChanged_ = false;
    std::size_t sorted_ = 0;              ///< places that lie in sorted runs
    std::size_t length_ = kMessagesOfRun; ///< of a sorted run
    std::vector<Place> merged_;           ///< of pairs of runs
    std::size_t left_ = 0;                ///< of the pair at hand, the next place of the first run
    std::size_t right_ = 0;               ///< and of the second
    std::vector<const KeySet*> keySets_;
    std::vector<MessageRef> ordered_;
    std::vector<const KeySet*> orderedKeySets_;
};

} // namespace tamblo
