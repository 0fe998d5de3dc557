#pragma once

#include "base/UniqueFunction.h"
#include "base/Value.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace tamblo::client {

/// An error as a reply brings it: the service's, the protocol's, or the library's own.
struct Error {
    std::string domain;
    std::int64_t code = 0;
    std::string message; ///< may be empty
};

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
    enum class Kind : std::uint8_t { null, boolean, value, error };

    Kind kind = Kind::null;
    bool boolean = false;
    const Value* value = nullptr;
    const Error* error = nullptr;
};

/// Takes a reply. Large enough to hold a `Callback` without an allocation.
using ReplyFunction = UniqueFunction<void(const ReplyView&), 64>;

} // namespace tamblo::client
