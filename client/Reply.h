#pragma once

#include "base/UniqueFunction.h"
#include "base/Value.h"
#include "wire/Protocol.h"

#include <cstdint>
#include <optional>
#include <string_view>

namespace tamblo::client {

/// An error as a reply brings it: the service's, the protocol's, or the library's own.
using wire::Error;

/// Errors that the library itself answers a request with.
inline constexpr std::string_view kErrorDomain = "com.vandra.tamblo.client";
enum class ErrorCode : std::int64_t {
    connectionLost = 1,  ///< it was sent; whether it was carried out is not known
    refused = 2,         ///< it was not sent: the queue was full, or it is longer than the service accepts
    closed = 3,          ///< the client was closed first
    unexpectedReply = 4, ///< the service answered something else than the request's kind of result
    tooManyPending = 5,  ///< it was not sent: a million requests are unanswered
};
[[nodiscard]] Error makeError(ErrorCode code);
[[nodiscard]] inline bool isError(const Error& error, ErrorCode code) noexcept {
    return error.domain == kErrorDomain && error.code == static_cast<std::int64_t>(code);
}

/// What a request was answered with: a value, or an error.
template <typename T> struct Result {
    T value{};
    std::optional<Error> error;

    [[nodiscard]] bool ok() const noexcept { return !error.has_value(); }
};

/// The result of a request that has none.
struct Nothing {};

template <typename T> using Callback = UniqueFunction<void(Result<T>&&)>;

/// A reply before it is known which kind of result the request wants. What it points to holds during the call
/// only.
struct ReplyView {
    const Error* error = nullptr;
    const Value* value = nullptr; ///< null for an error, and for a result that is null
};

/// Takes a reply. Large enough to hold a `Callback` without an allocation.
using ReplyFunction = UniqueFunction<void(const ReplyView&), 64>;

} // namespace tamblo::client
