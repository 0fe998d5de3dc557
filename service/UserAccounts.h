#pragma once

#include <cstddef>
#include <map>

#include <sys/types.h>

namespace tamblo {

/// What the clients of one user hold together, against the limits. Members of the service, one for each user
/// whom it has met; on the reporting server queue.
struct UserAccount {
    std::size_t sessions = 0;
    std::size_t configurationBytes = 0;
};
using UserAccounts = std::map<uid_t, UserAccount>;

} // namespace tamblo
