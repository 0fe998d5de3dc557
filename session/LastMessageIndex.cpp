#include "session/LastMessageIndex.h"

#include "base/Hash.h"

#include <utility>

namespace tamblo {

namespace {

constexpr std::size_t kInitialSlots = 16;

} // namespace

LastMessageIndex::LastMessageIndex() : slots_(kInitialSlots), seed_(processHashSeed()) {}

std::size_t LastMessageIndex::place(std::uint64_t key) const noexcept {
    const std::size_t mask = slots_.size() - 1;
    std::size_t at = mixBits(key ^ seed_) & mask;
    while (slots_[at].message != nullptr && slots_[at].key != key) {
        at = (at + 1) & mask;
    }
    return at;
}

void LastMessageIndex::add(const ZRReportingSessionMessage& message) {
    const std::uint64_t itsKey = key(message.category(), message.type());
    std::size_t at = place(itsKey);
    if (slots_[at].message == nullptr) {
        if ((used_ + 1) * 2 > slots_.size()) {
            grow();
            at = place(itsKey);
        }
        ++used_;
    }
    slots_[at] = {itsKey, &message};
}

void LastMessageIndex::rebuild(const std::vector<MessageRef>& messages) {
    clear();
    for (const MessageRef& message : messages) {
        add(*message);
    }
}

void LastMessageIndex::clear() {
    slots_.assign(kInitialSlots, Slot{});
    slots_.shrink_to_fit();
    used_ = 0;
}

void LastMessageIndex::grow() {
    const std::vector<Slot> old = std::exchange(slots_, std::vector<Slot>(slots_.size() * 2));
    for (const Slot& slot : old) {
        if (slot.message != nullptr) {
            slots_[place(slot.key)] = slot;
        }
    }
}

} // namespace tamblo
