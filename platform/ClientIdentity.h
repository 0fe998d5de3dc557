#pragma once

#include <sys/types.h>

namespace tamblo {

/// Who a client is, as the kernel reports it for the client's socket.
struct ClientIdentity {
    uid_t user = 0;
    pid_t process = 0;
};

} // namespace tamblo
