#include "os/ServiceManager.h"

#include "os/FileDescriptor.h"

#include <cstddef>
#include <cstdlib>
#include <cstring>

#include <sys/socket.h>
#include <sys/un.h>

namespace tamblo {

void notifyServiceManager(std::string_view state) noexcept {
    const char* const path = std::getenv("NOTIFY_SOCKET");
    sockaddr_un address{};
    if (path == nullptr || *path == '\0' || std::strlen(path) >= sizeof address.sun_path) {
        return;
    }
    const std::size_t length = std::strlen(path);
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, path, length);
    // A leading @ stands for the abstract namespace.
    if (address.sun_path[0] == '@') {
        address.sun_path[0] = '\0';
    }
    const FileDescriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    (void)::sendto(socket.get(), state.data(), state.size(), MSG_DONTWAIT | MSG_NOSIGNAL,
                   reinterpret_cast<const sockaddr*>(&address),
                   static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + length));
}

} // namespace tamblo
