#pragma once

#include "base/Dictionary.h"
#include "base/TextBuffer.h"
#include "base/Value.h"
#include "wire/Protocol.h"

#include <cstdint>
#include <optional>
#include <span>
#include <vector>

namespace tamblo::wire {

/// Appends a whole reply frame, length included: no error, and the result.
void appendNullReply(TextBuffer& out, std::uint64_t id);
void appendBooleanReply(TextBuffer& out, std::uint64_t id, bool result);
void appendUnsignedReply(TextBuffer& out, std::uint64_t id, std::uint64_t result);
void appendDictionaryReply(TextBuffer& out, std::uint64_t id, const Dictionary& result);
void appendIntegersReply(TextBuffer& out, std::uint64_t id, std::span<const std::int64_t> result);
void appendErrorReply(TextBuffer& out, std::uint64_t id, const Error& error);

/// A reply as the client reads it.
struct Reply {
    std::uint64_t id = 0;
    std::optional<Error> error;
    /// Absent for null.
    std::optional<Value> result;
};

/// Nothing when the item is not a reply.
[[nodiscard]] std::optional<Reply> decodeReply(std::span<const std::uint8_t> item);

} // namespace tamblo::wire
