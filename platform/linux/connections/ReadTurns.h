#pragma once

#include "platform/ProcessorShare.h"
#include "platform/linux/connections/ClientUser.h"

#include <deque>
#include <memory>

namespace tamblo {

/// The turns in which connections are read that have something to read: users take turns, and the connections
/// of one user among themselves, a read each. What one wake-up does not come to waits for the next, in its
/// place; so a client waits for one read of each other user, and a thousand busy connections of one user
/// delay nobody else. On the I/O thread.
class ReadTurns {
public:
    /// Has the connection read once in its turn; it must not be listed already.
    void add(const std::shared_ptr<LinuxConnection>& connection, const std::shared_ptr<ClientUser>& user);
    /// Reads in turns for a few milliseconds. Answers whether some are left.
    [[nodiscard]] bool readSome();

private:
    void readForSomeTime();

    ProcessorShare processorShare_;
    std::deque<std::shared_ptr<ClientUser>> users_; ///< those with readable connections
};

} // namespace tamblo
