#pragma once

#include <string>
#include <string_view>

/// Where the service tells how it is, for both ends. Whoever connects sends one line and is sent one document
/// and the end of the connection; `docs/protocol.md` has the lines and the documents.
namespace tamblo::wire {

inline constexpr std::string_view kStatusName = "com.vandra.tamblo.status";

/// The socket in the runtime directory.
[[nodiscard]] inline std::string statusSocketPath(std::string_view runtimeDirectory) {
    return std::string(runtimeDirectory).append("/").append(kStatusName);
}

} // namespace tamblo::wire
