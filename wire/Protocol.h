#pragma once

#include "base/ReplyError.h"
#include "base/TextBuffer.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

/// The client protocol, for both ends. A connection is a local stream socket; each direction is a sequence of
/// frames: a 4-byte little-endian length, then one CBOR item (RFC 8949) of that length.
///
///   request                [0, id, method, params]
///   reply                  [1, id, error, result]     error: null or {"domain", "code", "message"}
///   request without reply  [2, method, params]
namespace tamblo::wire {

inline constexpr std::string_view kServiceName = "com.vandra.tamblo.reporting";

inline constexpr std::size_t kLengthBytes = 4;
/// The longest frame. A message is some hundred bytes; this leaves room for a thousandfold of that and keeps
/// what one client can make the service hold small.
inline constexpr std::size_t kMaximumFrameBytes = 1024 * 1024;

enum class FrameKind : std::uint8_t { request = 0, reply = 1, requestWithoutReply = 2 };

using Error = ReplyError;
using tamblo::kLimitReached;
using tamblo::kProtocolErrorDomain;
inline constexpr std::int64_t kNotWellFormed = -32700;
inline constexpr std::int64_t kNotARequest = -32600;
inline constexpr std::int64_t kUnknownMethod = -32601;
inline constexpr std::int64_t kWrongParameters = -32602;

/// Begins a frame at the end of the buffer: leaves room for its length, behind which the item is written.
/// What is answered belongs to `finishFrame`.
[[nodiscard]] std::size_t beginFrame(TextBuffer& out);
/// Fills in the length. False, and the frame taken back, when it is longer than allowed.
[[nodiscard]] bool finishFrame(TextBuffer& out, std::size_t start) noexcept;

/// Where the service's socket lies.
[[nodiscard]] std::string socketPath(std::string_view runtimeDirectory);

} // namespace tamblo::wire
