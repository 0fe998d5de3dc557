#pragma once

#include "platform/ZRReportingServiceProtocol.h"
#include "session/MessageSort.h"
#include "session/ZRReportingSessionMessage.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <optional>
#include <vector>

namespace tamblo {

/// How far the stop of a session has come. It is done in parts, between which the queue does other work.
struct SessionStop {
    enum class Step : std::uint8_t { sort, index, workers, letGo, waiting, done };
    /// A message that came meanwhile.
    struct Waiting {
        MessageRef message;
        ErrorReply reply;
        std::size_t bytes;
    };

    SessionStop(std::vector<MessageRef>& messages, bool isShortStop) : isShort(isShortStop) {
        sort.emplace(messages);
    }

    const bool isShort; ///< done in one part
    Step step = Step::sort;
    std::optional<MessageSort> sort;
    std::size_t indexed = 0;          ///< messages entered into the index
    std::vector<std::size_t> workers; ///< places of those that are to be stopped, the next one last
    std::vector<MessageRef> past;     ///< messages that are to be let go
    bool isLarge = false;             ///< what is let go
    std::deque<Waiting> waiting;
    bool hasRefused = false;
    /// What is sent comes from the worker that is stopping, or has waited.
    bool isSending = false;
};

} // namespace tamblo
