#pragma once

#include "tests/service/RealService.h"

#include <optional>
#include <string>
#include <vector>

namespace tamblo::bridge::test {

/// A program that is ended with its owner.
class Program {
public:
    explicit Program(std::vector<std::string> words, const std::string& output = "/dev/null") {
        std::vector<char*> arguments;
        for (std::string& word : words) {
            arguments.push_back(word.data());
        }
        arguments.push_back(nullptr);
        pid_ = ::fork();
        if (pid_ == 0) {
            ::prctl(PR_SET_PDEATHSIG, SIGKILL);
            const int file = ::open(output.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600);
            ::dup2(file, STDOUT_FILENO);
            ::dup2(file, STDERR_FILENO);
            ::execvp(arguments.front(), arguments.data());
            ::_exit(127);
        }
    }
    ~Program() { end(SIGKILL); }
    Program(const Program&) = delete;
    Program& operator=(const Program&) = delete;

    /// Its exit status, or minus the signal; nothing when it runs on for too long.
    std::optional<int> wait() {
        int status = 0;
        if (pid_ <= 0 || !tamblo::test::eventually(
                             [this, &status] { return ::waitpid(pid_, &status, WNOHANG) == pid_; })) {
            return std::nullopt;
        }
        pid_ = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
    }
    std::optional<int> end(int signal = SIGTERM) {
        if (pid_ > 0) {
            ::kill(pid_, signal);
        }
        return wait();
    }
    [[nodiscard]] pid_t pid() const noexcept { return pid_; }

private:
    pid_t pid_ = -1;
};

} // namespace tamblo::bridge::test
