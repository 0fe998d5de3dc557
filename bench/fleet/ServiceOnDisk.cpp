#include "ServiceOnDisk.h"

#include "platform/linux/sinks/LineSinks.h"
#include "platform/linux/sinks/LinuxAnalyticsEventService.h"

#include <array>
#include <string_view>

namespace tamblo::bench::fleet {

namespace {

/// What clients' requests lead to besides the server queue.
constexpr std::array<std::string_view, 3> kFurtherQueues{"com.vandra.tamblo.accessories",
                                                         "com.vandra.tamblo.linkmeter.backends",
                                                         "com.vandra.tamblo.session.linkmeter"};

} // namespace

ServiceOnDisk::ServiceOnDisk(const std::string& configuration, const std::string& logs, WallTime start)
    : preferences_(configuration + "/preferences", log_), sinks_(logs, log_) {
    log_.setThreshold(LogLevel::fault);
    device_.clock.set(start);
    Platform& services = device_.services();
    services.analyticsEvents =
        std::make_unique<LinuxAnalyticsEventService>(sinks_, device_.clock, preferences_, log_);
    services.powerEvents = std::make_unique<LinuxPowerEventLog>(sinks_, device_.clock);
    services.diagnosticsMetrics = std::make_unique<LinuxDiagnosticsMetrics>(sinks_, device_.clock);
    auto callQuality = std::make_unique<LinuxCallQualityService>(sinks_, device_.clock, preferences_,
                                                                 *services.workQueues, log_);
    callQuality_ = callQuality.get();
    services.callQuality = std::move(callQuality);
    ConnectionListener& listener = device_.connections.listenerForServiceName("com.vandra.tamblo.reporting");
    listener.setDelegate(*service_);
    listener.resume();
}

std::unique_ptr<FakeClientConnection> ServiceOnDisk::connect(pid_t pid, const std::string& processName) {
    constexpr uid_t kUser = 1000;
    device_.processInformation.names[pid] = processName;
    auto connection = device_.connections.connect({kUser, pid}, turns_);
    run();
    return connection;
}

void ServiceOnDisk::turnTo(WallTime time) {
    const std::chrono::nanoseconds step = time - device_.clock.now();
    device_.clock.advance(step);
    device_.workQueues.elapse(std::chrono::duration_cast<std::chrono::milliseconds>(step));
    run();
}

void ServiceOnDisk::run() {
    std::size_t pieces = 1;
    while (pieces != 0) {
        pieces = device_.serverQueue().runAll();
        for (const std::string_view queue : kFurtherQueues) {
            pieces += device_.workQueues.run(queue);
        }
    }
}

std::uint64_t ServiceOnDisk::end() {
    run();
    service_.reset();
    run();
    callQuality_->writeHeldBack();
    sinks_.flush();
    return sinks_.lostLines();
}

} // namespace tamblo::bench::fleet
