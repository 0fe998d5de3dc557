#pragma once

#include "os/FileDescriptor.h"

#include <sys/types.h>

namespace tamblo {

/// The user who has made the connection, as the kernel knows.
[[nodiscard]] uid_t peerUser(int socket) noexcept;

/// Ends a connection of a stream socket so that the peer reads everything that it was sent, and then the end:
/// where something lies there that the peer has sent and nobody has read, closing alone would be a break
/// instead. Does not block; what can lie there is bounded by the sockets' buffers.
void closeInOrder(FileDescriptor socket) noexcept;

} // namespace tamblo
