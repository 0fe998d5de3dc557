#pragma once

#include "platform/Clock.h"
#include "service/ZRReportingServiceDelegateProtocol.h"
#include "util/Context.h"

#include <sys/types.h>

namespace tamblo {

/// Reports how long a client was connected, once its connection has ended for good, which was at `end`;
/// `client` is null when it is gone already. Once for each client: its connection may end while the service
/// shuts down. On the reporting server queue.
void reportClientUptime(const Context& context, const ClientRef& client, pid_t processIdentifier,
                        WallTime end);

} // namespace tamblo
