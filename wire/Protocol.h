#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
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

enum class Method : std::uint8_t {
    createReportingSession,
    setServiceType,
    getServiceNameForReporterID,
    setConfiguration,
    startReportingSessionForID,
    sendMessage,
    stopReportingSessionForID,
    destroyReportingSession,
    reporterID,
    getAllReporters,
    killService,
};

inline constexpr std::array<std::string_view, 11> kMethodNames{
    "createReportingSession",
    "setServiceType",
    "getServiceNameForReporterID",
    "setConfiguration",
    "startReportingSessionForID",
    "sendMessage",
    "stopReportingSessionForID",
    "destroyReportingSession",
    "reporterID",
    "getAllReporters",
    "killService",
};

[[nodiscard]] constexpr std::string_view methodName(Method method) noexcept {
    return kMethodNames[static_cast<std::size_t>(method)];
}
[[nodiscard]] std::optional<Method> methodNamed(std::string_view name) noexcept;

/// The domain of the protocol's own errors; their codes are those of JSON-RPC 2.0.
inline constexpr std::string_view kProtocolErrorDomain = "com.vandra.tamblo.protocol";
inline constexpr std::int64_t kNotWellFormed = -32700;
inline constexpr std::int64_t kNotARequest = -32600;
inline constexpr std::int64_t kUnknownMethod = -32601;
inline constexpr std::int64_t kWrongParameters = -32602;

/// An error as it travels: of the service's own domain or of the protocol's.
struct Error {
    std::string domain;
    std::int64_t code = 0;
    std::string message; ///< empty: absent
};

/// Where the service's socket lies.
[[nodiscard]] std::string socketPath(std::string_view runtimeDirectory);

} // namespace tamblo::wire
