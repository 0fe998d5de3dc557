#pragma once

#include "base/Dictionary.h"
#include "base/TextBuffer.h"
#include "client/Vocabulary.h"
#include "wire/Protocol.h"

#include <cstdint>
#include <span>

namespace tamblo::client {

/// Writes requests as whole frames, length included, into an empty buffer.
///
/// The id of a request that wants a reply is written in its longest form and as 0: it is filled in when the
/// frame is about to be sent, by the thread that keeps the pending replies. Each answers false, and leaves
/// the buffer empty, when the frame would be longer than allowed.
namespace request_frame {

[[nodiscard]] bool writeSimple(TextBuffer& out, bool wantsReply, wire::Method method);
[[nodiscard]] bool writeForReporter(TextBuffer& out, bool wantsReply, wire::Method method,
                                    std::int64_t reporterID);
[[nodiscard]] bool writeSetServiceType(TextBuffer& out, bool wantsReply, ServiceType type,
                                       std::int64_t reporterID);
[[nodiscard]] bool writeSetConfiguration(TextBuffer& out, bool wantsReply, const Dictionary& configuration,
                                         std::int64_t reporterID);
[[nodiscard]] bool writeMessage(TextBuffer& out, bool wantsReply, const Dictionary& payload,
                                EventCategory category, EventType type,
                                std::span<const std::int64_t> reporterIDs);

/// The same in pieces, for a payload that is written entry by entry: everything before the payload's first
/// entry, and everything after its last.
void beginMessage(TextBuffer& out, bool wantsReply);
[[nodiscard]] bool finishMessage(TextBuffer& out, bool wantsReply, std::size_t entries,
                                 EventCategory category, EventType type,
                                 std::span<const std::int64_t> reporterIDs);

void fillInId(TextBuffer& frame, std::uint64_t id) noexcept;

} // namespace request_frame

} // namespace tamblo::client
