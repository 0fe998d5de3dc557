#pragma once

#include "client/Reply.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <vector>

namespace tamblo::client {

/// The requests that wait for their replies, found by id in one step and without an allocation for each.
///
/// An id holds the place of its entry and a number that is never used again, so that a reply that comes a
/// second time, or hours late, cannot be taken for another request's. Owned and used by the pumping thread
/// alone; a reply function may send, but must not come back to this table.
class PendingReplies {
public:
    /// Some requests are never answered, so that their entries pile up: no more than this many.
    static constexpr std::size_t kMaximumEntries = std::size_t{1} << 20;

    /// An id for a request that is about to be sent; nothing when the table is full.
    [[nodiscard]] std::optional<std::uint64_t> reserve();
    /// Who takes the replies to a request that has been sent.
    void expect(std::uint64_t id, ReplyFunction reply, bool everyReply) noexcept;
    void cancel(std::uint64_t id) noexcept;
    /// Hands a reply on; false when nobody waits for it.
    bool deliver(std::uint64_t id, const ReplyView& reply);
    /// Answers all that were sent. Ids that are only reserved stay.
    void failAll(const Error& error);

private:
    static constexpr unsigned kIndexBits = 20;
    static constexpr std::uint32_t kNone = 0xFFFFFFFF;

    struct Entry {
        std::uint64_t id = 0; ///< 0: free
        ReplyFunction reply;
        std::uint32_t nextFree = kNone;
        bool everyReply = false;
    };
    [[nodiscard]] static std::size_t indexOf(std::uint64_t id) noexcept {
        return static_cast<std::size_t>(id & (kMaximumEntries - 1));
    }
    void free(std::size_t index) noexcept;

    std::vector<Entry> entries_;
    std::uint32_t firstFree_ = kNone;
    std::uint64_t lastNumber_ = 0;
};

} // namespace tamblo::client
