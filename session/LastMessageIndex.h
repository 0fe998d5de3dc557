#pragma once

#include "base/Hash.h"
#include "session/ZRReportingSessionMessage.h"

#include <cstddef>
#include <cstdint>
#include <unordered_map>

namespace tamblo {

/// The last message of each category and type in a session's list: what a walk over the list from its end
/// would find first. The messages are the list's, which must hold them for as long as they stand here.
class LastMessageIndex {
public:
    [[nodiscard]] const ZRReportingSessionMessage* find(AudioEventCategory category,
                                                        AudioEventType type) const noexcept {
        const auto found = last_.find(key(category, type));
        return found != last_.end() ? found->second : nullptr;
    }
    /// Bytes of memory for one more category and type.
    static constexpr std::size_t kBytesOfKind = 48;

    /// Whether it is the first of its category and type.
    bool add(const ZRReportingSessionMessage& message) {
        return last_.insert_or_assign(key(message.category(), message.type()), &message).second;
    }
    /// A message that is older than all that were added: whether it is the first of its category and type.
    bool addOlder(const ZRReportingSessionMessage& message) {
        return last_.try_emplace(key(message.category(), message.type()), &message).second;
    }
    /// How many categories and types there are.
    [[nodiscard]] std::size_t size() const noexcept { return last_.size(); }
    /// The message goes from the list.
    void remove(const ZRReportingSessionMessage& message) {
        const auto found = last_.find(key(message.category(), message.type()));
        if (found != last_.end() && found->second == &message) {
            last_.erase(found);
        }
    }
    void clear() { last_ = Map(); }

private:
    static std::uint64_t key(AudioEventCategory category, AudioEventType type) noexcept {
        return std::uint64_t{category} << 16U | type;
    }

    using Map = std::unordered_map<std::uint64_t, const ZRReportingSessionMessage*, SeededHash>;
    Map last_;
};

} // namespace tamblo
