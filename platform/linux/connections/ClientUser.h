#pragma once

#include "base/Mutex.h"

#include <atomic>
#include <cstddef>
#include <deque>
#include <memory>
#include <vector>

#include <sys/types.h>

namespace tamblo {

class LinuxConnection;

/// What the connections of one user hold and wait for together, against the limits. Owned by these
/// connections; the connection service finds it again by the user's number.
struct ClientUser {
    explicit ClientUser(uid_t number) : user(number) {}

    const uid_t user;

    // The I/O thread's.
    std::size_t connections = 0;
    bool isTurnedAway = false;                               ///< since its last connection ended
    std::size_t unfinishedBytes = 0;                         ///< of frames that have begun
    std::deque<std::shared_ptr<LinuxConnection>> readable{}; ///< in the order of their turns

    std::atomic<std::size_t> waitingBytes{0}; ///< of requests that are still to be carried out
    std::atomic<std::size_t> refusedBytes{0}; ///< of replies that the sockets have not taken

    Mutex mutex{};
    /// Read no further until less waits.
    std::deque<std::shared_ptr<LinuxConnection>> heldBack TAMBLO_GUARDED_BY(mutex){};
    /// Whose peers have read nothing of what waits for them for a second.
    std::vector<std::weak_ptr<LinuxConnection>> silent TAMBLO_GUARDED_BY(mutex){};
};

} // namespace tamblo
