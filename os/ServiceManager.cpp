#include "os/ServiceManager.h"

#include "os/FileDescriptor.h"
#include "os/LocalAddress.h"

#include <cstdlib>
#include <string>

namespace tamblo {

void notifyServiceManager(std::string_view state) noexcept {
    const char* const variable = std::getenv("NOTIFY_SOCKET");
    std::string path(variable != nullptr ? variable : "");
    // A leading @ stands for the abstract namespace.
    if (path.starts_with('@')) {
        path.front() = '\0';
    }
    if (const auto address = LocalAddress::of(path)) {
        const FileDescriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
        (void)::sendto(socket.get(), state.data(), state.size(), MSG_DONTWAIT | MSG_NOSIGNAL, address->get(),
                       address->size());
    }
}

} // namespace tamblo
