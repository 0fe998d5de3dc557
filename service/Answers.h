#pragma once

#include "platform/ZRReportingServiceProtocol.h"

namespace tamblo {

/// Replies are optional: a client that wants none gives none.
template <typename Reply, typename... Result> void answer(Reply& reply, const Result&... result) {
    if (reply) {
        reply(nullptr, result...);
    }
}

inline void refuse(BooleanReply& reply, const ReplyError& error) {
    if (reply) {
        reply(&error, false);
    }
}

} // namespace tamblo
