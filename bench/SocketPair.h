#pragma once

#include "os/FileDescriptor.h"

#include <cerrno>
#include <system_error>

#include <sys/socket.h>

namespace tamblo::bench {

/// Two connected sockets: the benchmark's own, and that of a floor's other process.
struct SocketPair {
    SocketPair() {
        int both[2];
        if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, both) != 0) {
            throw std::system_error(errno, std::generic_category(), "socketpair");
        }
        ours = FileDescriptor(both[0]);
        theirs = FileDescriptor(both[1]);
    }
    FileDescriptor ours;
    FileDescriptor theirs;
};

} // namespace tamblo::bench
