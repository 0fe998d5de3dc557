#pragma once

#include <stdexcept>
#include <string>

#include <sys/socket.h>
#include <sys/un.h>

namespace tamblo::test {

[[nodiscard]] inline sockaddr_un addressOf(const std::string& socketPath) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    socketPath.copy(address.sun_path, sizeof address.sun_path - 1);
    return address;
}

/// A local socket of this type that is bound to the path; one for a stream listens.
[[nodiscard]] inline int boundSocket(int type, const std::string& path) {
    const sockaddr_un address = addressOf(path);
    const int socket = ::socket(AF_UNIX, type | SOCK_CLOEXEC, 0);
    if (::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
        (type == SOCK_STREAM && ::listen(socket, 8) != 0)) {
        throw std::runtime_error("cannot bind " + path);
    }
    return socket;
}

} // namespace tamblo::test
