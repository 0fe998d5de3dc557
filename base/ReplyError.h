#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace tamblo {

/// Why a request was not carried out, as a reply brings it: of the service's own domain, the protocol's, or
/// the client library's.
struct ReplyError {
    std::string domain;
    std::int64_t code = 0;
    std::string message{}; ///< for people; empty: absent
};

/// The domain of the protocol's own errors; their codes are those of JSON-RPC 2.0, which leaves this one to
/// the server.
inline constexpr std::string_view kProtocolErrorDomain = "com.vandra.tamblo.protocol";
inline constexpr std::int64_t kLimitReached = -32000;

/// How a request beyond a limit is refused; the message names the limit as its preference is named. Those
/// that no preference changes have names of the same kind: `descriptors`, `memory`.
[[nodiscard]] ReplyError limitReached(std::string_view name, std::size_t limit);

} // namespace tamblo
