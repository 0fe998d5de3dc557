#include "client/SendQueue.h"

#include <algorithm>
#include <bit>
#include <cstring>

namespace tamblo::client {

namespace {

void prepare(TextBuffer& frame) {
    std::memset(frame.room(OutgoingFrame::kPreparedBytes), 0, OutgoingFrame::kPreparedBytes);
}

} // namespace

void OutgoingFrame::recycle() {
    frame.clear();
    if (frame.capacity() > kPreparedBytes) {
        frame.reset();
        prepare(frame);
    }
    reply.reset();
    id = 0;
    wantsEveryReply = false;
}

SendQueue::SendQueue(std::size_t capacity)
    : mask_(std::bit_ceil(std::max<std::size_t>(capacity, 2)) - 1), slots_(new Slot[mask_ + 1]) {
    for (std::size_t i = 0; i <= mask_; ++i) {
        slots_[i].sequence.store(i, std::memory_order_relaxed);
        prepare(slots_[i].frame);
    }
}

SendQueue::Slot* SendQueue::claim() noexcept {
    std::size_t position = tail_.load(std::memory_order_relaxed);
    while (true) {
        Slot& slot = slots_[position & mask_];
        const std::size_t sequence = slot.sequence.load(std::memory_order_acquire);
        const auto turn = static_cast<std::ptrdiff_t>(sequence - position);
        if (turn < 0) {
            return nullptr;
        }
        if (turn > 0) {
            position = tail_.load(std::memory_order_relaxed);
        } else if (tail_.compare_exchange_weak(position, position + 1, std::memory_order_relaxed)) {
            slot.position = position;
            return &slot;
        }
    }
}

SendQueue::Slot* SendQueue::peek(std::size_t offset) noexcept {
    const std::size_t position = head_ + offset;
    Slot& slot = slots_[position & mask_];
    return slot.sequence.load(std::memory_order_seq_cst) == position + 1 ? &slot : nullptr;
}

void SendQueue::pop() {
    Slot& slot = slots_[head_ & mask_];
    slot.recycle();
    slot.sequence.store(head_ + mask_ + 1, std::memory_order_release);
    ++head_;
}

} // namespace tamblo::client
