#pragma once

#include "platform/RequestTurns.h"
#include "platform/linux/settings/LinuxPreferences.h"
#include "platform/linux/sinks/AppendOnlyFile.h"
#include "platform/linux/sinks/LinuxCallQualityService.h"
#include "service/ZRReportingService.h"
#include "tests/fakes/FakePlatform.h"

#include <chrono>
#include <cstdint>
#include <memory>
#include <string>

namespace tamblo::bench::fleet {

/// The service with its real sessions, workers and sinks, on a device whose clock is turned by whoever plays
/// it and whose clients call it directly, without a socket. One at a time in a process.
class ServiceOnDisk {
public:
    /// Sinks are written below `logs`, which exists.
    ServiceOnDisk(const std::string& configuration, const std::string& logs, WallTime start);
    ServiceOnDisk(const ServiceOnDisk&) = delete;
    ServiceOnDisk& operator=(const ServiceOnDisk&) = delete;

    [[nodiscard]] FakePlatform& device() noexcept { return device_; }
    [[nodiscard]] std::unique_ptr<FakeClientConnection> connect(pid_t pid, const std::string& processName);
    /// Turns the clock on to a time, which is no earlier than the present one.
    void turnTo(WallTime time);
    /// Has everything done that was asked for.
    void run();
    /// Ends the service, whose clients have all gone, and writes what waits: how many lines could not be
    /// written in its time.
    [[nodiscard]] std::uint64_t end();

private:
    FakeLog log_;
    LinuxPreferences preferences_;
    SinkFiles sinks_;
    FakePlatform device_{LogLevel::fault};
    LinuxCallQualityService* callQuality_ = nullptr;
    RequestTurns turns_{device_.serverQueue(), device_.clock};
    std::unique_ptr<ZRReportingService> service_ = std::make_unique<ZRReportingService>(device_.context());
};

} // namespace tamblo::bench::fleet
