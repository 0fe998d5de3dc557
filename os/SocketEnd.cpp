#include "os/SocketEnd.h"

#include <array>

#include <sys/socket.h>

namespace tamblo {

namespace {

/// More than any buffer has: a peer that goes on sending is refused by the shutdown.
constexpr int kMostReads = 4096;

} // namespace

void closeInOrder(FileDescriptor socket) noexcept {
    std::array<char, 4096> bytes;
    ::shutdown(socket.get(), SHUT_RDWR);
    for (int i = 0; i != kMostReads && ::recv(socket.get(), bytes.data(), bytes.size(), MSG_DONTWAIT) > 0;
         ++i) {
    }
}

} // namespace tamblo
