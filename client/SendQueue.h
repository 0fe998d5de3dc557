#pragma once

#include "base/TextBuffer.h"
#include "client/Reply.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>

namespace tamblo::client {

/// A request on its way to the socket: its frame, and who takes the reply.
struct OutgoingFrame {
    /// Frames up to this size are written into memory that the queue holds from the start.
    static constexpr std::size_t kPreparedBytes = 1024;

    TextBuffer frame;     ///< empty: given up, to be skipped
    ReplyFunction reply;  ///< empty: none is wanted
    std::uint64_t id = 0; ///< of the request, once one is assigned
    bool wantsEveryReply = false;

    /// Ready for the next request; memory of a long frame is given back.
    void recycle();
};

/// The bounded queue between the threads that send and the one that pumps.
///
/// Any number of producers, one consumer, no locks: each slot carries a sequence number that says whose turn
/// it is (D. Vyukov's bounded queue). A producer claims a slot, writes its frame straight into it and
/// publishes it; a full queue refuses at once. Frames leave in the order in which their slots were claimed,
/// so each thread's in the order in which it sent them. A producer that is held up between claiming and
/// publishing holds up those behind it.
class SendQueue {
public:
    struct Slot : OutgoingFrame {
        std::atomic<std::size_t> sequence{0};
        std::size_t position = 0;
    };

    /// The capacity is rounded up to a power of two. All memory is allocated and touched here.
    explicit SendQueue(std::size_t capacity);
    SendQueue(const SendQueue&) = delete;
    SendQueue& operator=(const SendQueue&) = delete;

    [[nodiscard]] std::size_t capacity() const noexcept { return mask_ + 1; }

    /// Any thread: a slot to write to, or null when the queue is full. It has to be published, come what may.
    [[nodiscard]] Slot* claim() noexcept;
    void publish(Slot& slot, std::memory_order order) noexcept {
        slot.sequence.store(slot.position + 1, order);
    }

    /// The consumer: the slot at this distance from the front, or null when it is not published yet.
    [[nodiscard]] Slot* peek(std::size_t offset) noexcept;
    void pop();
    [[nodiscard]] bool empty() noexcept { return peek(0) == nullptr; }

private:
    static constexpr std::size_t kCacheLine = 64;

    const std::size_t mask_;
    const std::unique_ptr<Slot[]> slots_;
    alignas(kCacheLine) std::atomic<std::size_t> tail_{0};
    alignas(kCacheLine) std::size_t head_ = 0; ///< the consumer's
};

} // namespace tamblo::client
