#include "platform/linux/connections/HeldReplies.h"

#include "platform/linux/connections/LinuxConnection.h"

#include <utility>

namespace tamblo {

void HeldReplies::add(std::shared_ptr<LinuxConnection> connection) {
    const MutexLock lock(mutex_);
    connections_.push_back(std::move(connection));
}

void HeldReplies::release() {
    std::vector<std::shared_ptr<LinuxConnection>> connections;
    {
        const MutexLock lock(mutex_);
        connections.swap(connections_);
    }
    for (const std::shared_ptr<LinuxConnection>& connection : connections) {
        connection->releaseReplies();
    }
}

} // namespace tamblo
