#pragma once

#include "session/ZRReportingSessionMessage.h"
#include "util/AudioEvents.h"

#include <span>

namespace tamblo {

/// The summary event of a session for the call-quality service: under every key that its messages held, all
/// of the key's values, joined by commas in the messages' order, and the service type under a key of its own.
/// Counted are the messages that were sent while the session was started and are no repeats. Where they were
/// destined does not matter. Its time grows with the values, not with their square: a session may have held
/// millions of them. On any thread, given copies of the session's messages.
[[nodiscard]] Dictionary linkmeterSummary(std::span<const MessageRef> messages, AudioServiceType serviceType);

} // namespace tamblo
