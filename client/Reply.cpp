#include "client/Reply.h"

namespace tamblo::client {

namespace {

std::string_view messageFor(ErrorCode code) noexcept {
    switch (code) {
    case ErrorCode::connectionLost:
        return "the connection to the service was lost before it answered";
    case ErrorCode::refused:
        return "not sent: the queue is full, or the message is longer than the service accepts";
    case ErrorCode::closed:
        return "the client was closed before the service answered";
    case ErrorCode::unexpectedReply:
        return "the service answered with another kind of result";
    case ErrorCode::tooManyPending:
        return "too many requests are unanswered";
    }
    return "";
}

} // namespace

Error makeError(ErrorCode code) {
    return {std::string(kErrorDomain), static_cast<std::int64_t>(code), std::string(messageFor(code))};
}

} // namespace tamblo::client
