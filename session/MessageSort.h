#pragma once

#include "base/KeyPlaces.h"
#include "session/ZRReportingSessionMessage.h"

#include <cstddef>
#include <cstdint>
#include <vector>

namespace tamblo {

/// Sorts messages by epoch time, stably, a part at a time; a time that is not a number counts as 0. The list
/// must not change meanwhile but for this.
class MessageSort {
public:
    explicit MessageSort(std::vector<MessageRef>& messages);

    /// Does the next part, of some milliseconds. Whether all is done.
    [[nodiscard]] bool sortSome();
    /// Whether the order changed, once all is done.
    [[nodiscard]] bool hasChanged() const noexcept { return hasChanged_; }

private:
    /// Messages whose times are read, or that are sorted among themselves, in one part.
    static constexpr std::size_t kMessagesOfPart = 16'384;

    struct Place {
        double time;
        std::uint32_t index;
    };

    void readTimes();
    void sortRun();
    void mergeRuns();
    void reorder();

    std::vector<MessageRef>& messages_;
    KeyPlaces keyPlaces_;
    std::vector<Place> places_;
    bool isSorted_ = true; ///< as far as was read
    bool hasChanged_ = false;
    std::size_t sorted_ = 0;               ///< places that lie in sorted runs
    std::size_t length_ = kMessagesOfPart; ///< of a sorted run
};

} // namespace tamblo
