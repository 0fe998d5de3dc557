#pragma once

#include <string_view>

namespace tamblo {

/// Tells the service manager about the process's state (`READY=1`, `STOPPING=1`), by the socket that it names
/// in NOTIFY_SOCKET; without one, nobody. Does not block.
void notifyServiceManager(std::string_view state) noexcept;

} // namespace tamblo
