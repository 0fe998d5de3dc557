#pragma once

#include "../TemporaryDirectory.h"

#include <chrono>
#include <cstdint>
#include <string>

#include <sys/types.h>

namespace tamblo::bench {

/// The real service in directories that outlive it, started and killed over and over.
class CrashedService {
public:
    /// With a library's path, the service's clock of the day is what `shiftClock` makes of it.
    CrashedService(std::string program, std::string clockLibrary);
    ~CrashedService();
    CrashedService(const CrashedService&) = delete;
    CrashedService& operator=(const CrashedService&) = delete;

    void start();
    /// Whether it came to accept connections in time.
    [[nodiscard]] bool awaitReady() const;
    void kill();
    /// SIGTERM; whether it ended in order, in time.
    [[nodiscard]] bool stop();

    [[nodiscard]] const std::string& socketPath() const noexcept { return socketPath_; }
    [[nodiscard]] std::string logsDirectory() const { return directory_.path() + "/logs"; }
    /// How many lost records the log has told of so far.
    [[nodiscard]] std::uint64_t toldLosses() const;
    [[nodiscard]] std::uint64_t bytesLogged() const;

    /// No file grows beyond this from now on.
    void limitFiles(std::uint64_t bytes) const;
    void liftLimit() const;
    /// Sets the service's clock of the day forward, or back, from the machine's.
    void shiftClock(std::chrono::seconds shift) const;

private:
    TemporaryDirectory directory_;
    std::string program_;
    std::string clockLibrary_;
    std::string socketPath_;
    pid_t pid_ = -1;
};

} // namespace tamblo::bench
