#include "Users.h"

#include <csignal>

#include <grp.h>
#include <sys/prctl.h>
#include <unistd.h>

namespace tamblo::bench {

bool mayChangeUser() noexcept {
    return ::geteuid() == 0;
}

void becomeUser(uid_t user) noexcept {
    if (!mayChangeUser()) {
        return;
    }
    if (::setgroups(0, nullptr) != 0 || ::setresgid(user, user, user) != 0 ||
        ::setresuid(user, user, user) != 0) {
        ::_exit(126);
    }
    // The change of the user took it back.
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
}

} // namespace tamblo::bench
