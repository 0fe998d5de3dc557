#pragma once

#include "base/Cbor.h"
#include "base/Value.h"
#include "client/Engine.h"
#include "client/Vocabulary.h"

#include <cstdint>
#include <span>
#include <string_view>
#include <type_traits>

namespace tamblo::client {

/// Writes one message straight into the send queue, entry by entry, without a `Dictionary` in between: for
/// threads that must not allocate. Come by it through `Client::message`; use it on one thread and at once,
/// since messages that others send meanwhile wait behind it. Each key may be set once. A writer that is
/// dropped unsent sends nothing; one that got no place in the queue swallows what it is given and says so at
/// the end.
class MessageWriter {
public:
    explicit MessageWriter(Engine& engine);
    MessageWriter(const MessageWriter&) = delete;
    MessageWriter& operator=(const MessageWriter&) = delete;

    template <typename T> MessageWriter& set(std::string_view key, const T& value) {
        if (frame_) {
            CborWriter writer(frame_->frame);
            writer.text(key);
            if constexpr (std::is_convertible_v<const T&, std::string_view>) {
                writer.text(value);
            } else {
                writer.value(Value(value));
            }
            ++entries_;
        }
        return *this;
    }

    /// False when the message was not sent: the queue was full, or the message is too long.
    bool send(EventCategory category, EventType type, std::span<const std::int64_t> reporterIDs);

private:
    Engine& engine_;
    ClaimedFrame frame_;
    std::size_t mapOffset_ = 0; ///< where the payload's map begins
    std::size_t entries_ = 0;
};

} // namespace tamblo::client
