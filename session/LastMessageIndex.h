#pragma once

#include "base/Hash.h"
#include "session/ZRReportingSessionMessage.h"

#include <cstddef>
#include <cstdint>
#include <unordered_map>
#include <vector>

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
    void add(const ZRReportingSessionMessage& message) {
        last_[key(message.category(), message.type())] = &message;
    }
    void rebuild(const std::vector<MessageRef>& messages) {
        last_.clear();
        for (const MessageRef& message : messages) {
            add(*message);
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
