#pragma once

#include "base/UniqueFunction.h"
#include "session/MessageSort.h"
#include "session/ZRReportingSessionMessage.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <vector>

namespace tamblo {

/// How far the stop of a session has come. It is done in parts, between which the queue does other work.
struct SessionStop {
    enum class Step : std::uint8_t { sort, index, workers, letGo, done };

    SessionStop(std::vector<MessageRef>& messages, bool isShortStop) : isShort(isShortStop) {
        sort.emplace(messages);
    }

    const bool isShort; ///< done in one part
    Step step = Step::sort;
    std::optional<MessageSort> sort;
    std::vector<const KeySet*> keySets; ///< of the messages that there were, once they are sorted
    std::size_t kinds = 0;              ///< categories and types that the index had
    std::size_t indexed = 0;            ///< messages looked at for it, from the last one on
    std::vector<std::size_t> workers;   ///< places of those that are to be stopped, the next one last
    std::vector<MessageRef> past;       ///< messages that are to be let go
    std::size_t heldBytes = 0;          ///< of those that they are still to send
    bool isFullTold = false;
    std::vector<UniqueFunction<void()>> waiting; ///< for the end
};

} // namespace tamblo
