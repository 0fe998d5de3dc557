#pragma once

#include "session/ZRReportingSessionMessage.h"

#include <cstddef>
#include <cstdint>
#include <vector>

namespace tamblo {

/// The last message of each category and type in a session's list: what a walk over the list from its end
/// would find first. An open-addressing table; it grows with the number of pairs, of which a client uses a
/// few dozen. The messages are the list's, which must hold them for as long as they stand here.
class LastMessageIndex {
public:
    LastMessageIndex();

    [[nodiscard]] const ZRReportingSessionMessage* find(AudioEventCategory category,
                                                        AudioEventType type) const noexcept {
        return slots_[place(key(category, type))].message;
    }
    void add(const ZRReportingSessionMessage& message);
    void rebuild(const std::vector<MessageRef>& messages);
    void clear();

private:
    struct Slot {
        std::uint64_t key = 0;
        const ZRReportingSessionMessage* message = nullptr;
    };

    static std::uint64_t key(AudioEventCategory category, AudioEventType type) noexcept {
        return std::uint64_t{category} << 16U | type;
    }
    /// Where the key stands, or the free slot where it would.
    [[nodiscard]] std::size_t place(std::uint64_t key) const noexcept;
    void grow();

    std::vector<Slot> slots_;
    std::size_t used_ = 0;
    /// Differs from process to process, so that a client cannot choose categories that collide.
    std::uint64_t seed_;
};

} // namespace tamblo
