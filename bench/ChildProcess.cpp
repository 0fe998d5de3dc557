#include "ChildProcess.h"

#include "Processes.h"

#include <cerrno>
#include <csignal>
#include <system_error>

#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace tamblo::bench {

ChildProcess::ChildProcess(int processor, const std::function<void()>& run) : pid_(::fork()) {
    if (pid_ < 0) {
        throw std::system_error(errno, std::generic_category(), "fork");
    }
    if (pid_ == 0) {
        ::prctl(PR_SET_PDEATHSIG, SIGKILL);
        try {
            pinThisThread(processor);
            run();
        } catch (...) {
            ::_exit(1);
        }
        ::_exit(0);
    }
}

bool ChildProcess::hasEnded() const noexcept {
    siginfo_t ended{};
    // Left to be waited for, so that the number is not given to another process.
    return ::waitid(P_PID, static_cast<id_t>(pid_), &ended, WEXITED | WNOHANG | WNOWAIT) == 0 &&
           ended.si_pid == pid_;
}

ChildProcess::~ChildProcess() {
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
}

} // namespace tamblo::bench
