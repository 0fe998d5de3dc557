#include "os/StreamSocket.h"

#include <array>

#include <sys/socket.h>

namespace tamblo {

namespace {

/// More than any buffer has: a peer that goes on sending is refused by the shutdown.
constexpr int kMostReads = 4096;

} // namespace

uid_t peerUser(int socket) noexcept {
    ucred credentials{};
    socklen_t length = sizeof credentials;
    static_cast<void>(::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &length));
    return credentials.uid;
}

void closeInOrder(FileDescriptor socket) noexcept {
    std::array<char, 4096> bytes;
    ::shutdown(socket.get(), SHUT_RDWR);
    for (int i = 0; i != kMostReads && ::recv(socket.get(), bytes.data(), bytes.size(), MSG_DONTWAIT) > 0;
         ++i) {
    }
}

} // namespace tamblo
