#pragma once

#include "service/ZRReportingServiceDelegateProtocol.h"

#include <sys/types.h>

namespace tamblo {

/// Reports how long a client was connected, once its connection has ended for good; `client` is null when it
/// is gone already. Once for each client: its connection may end while the service shuts down. On the
/// reporting server queue.
void reportClientUptime(const ClientRef& client, pid_t processIdentifier);

} // namespace tamblo
