#pragma once

#include <functional>

#include <sys/types.h>

namespace tamblo::bench {

/// A fork of this process that runs one function on one processor, such as the other end of a floor. The
/// destructor ends it by its own process identifier; it ends with this process too.
class ChildProcess {
public:
    ChildProcess(int processor, const std::function<void()>& run);
    ~ChildProcess();
    ChildProcess(const ChildProcess&) = delete;
    ChildProcess& operator=(const ChildProcess&) = delete;

    [[nodiscard]] pid_t pid() const noexcept { return pid_; }
    /// Whether the function has returned.
    [[nodiscard]] bool hasEnded() const noexcept;

private:
    pid_t pid_ = -1;
};

} // namespace tamblo::bench
