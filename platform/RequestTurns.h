#pragma once

#include "base/UniqueFunction.h"
#include "platform/ClientIdentity.h"
#include "platform/Clock.h"
#include "platform/WorkQueue.h"

#include <memory>

namespace tamblo {

/// The turns that clients take on the reporting server queue.
///
/// Each client has a queue of its own. Users take turns, and the clients of one user among themselves; a turn
/// is a slice of time as the clock measures it, however many requests fit into it. So a client waits for one
/// slice of each other user, and one of each other client of its own, whatever these have asked for: a user
/// with five thousand busy connections weighs as much as one with a single one. Only a piece of work that is
/// itself longer than a slice makes others wait for longer, which is why long requests are carried out in
/// pieces.
///
/// Several turns make one piece of work of the server queue, at whose end its replies are let go. Made after
/// the server queue and gone before it; the queues that it has made may be let go later.
class RequestTurns {
public:
    RequestTurns(SerialQueue& serverQueue, const Clock& clock);
    ~RequestTurns();
    RequestTurns(const RequestTurns&) = delete;
    RequestTurns& operator=(const RequestTurns&) = delete;

    /// A queue for a client. `outOfMemory` is called on the server queue when there was no memory for one of
    /// its pieces, which then is lost. From any thread.
    [[nodiscard]] std::shared_ptr<RequestQueue> makeQueue(const ClientIdentity& client,
                                                          UniqueFunction<void()> outOfMemory);
    /// Ends the piece of the server queue soon, with what it has carried out by then. From any thread.
    void endPiece() noexcept;

private:
    struct State;
    class Queue;

    const std::shared_ptr<State> state_;
};

} // namespace tamblo
