#include "platform/linux/LinuxPlatform.h"

#include "os/ServiceManager.h"
#include "platform/linux/captures/LinuxBugCaptureService.h"
#include "platform/linux/captures/LinuxDiagnosticCapture.h"
#include "platform/linux/captures/LinuxMemoryLog.h"
#include "platform/linux/connections/LinuxConnectionService.h"
#include "platform/linux/device/LinuxAccessories.h"
#include "platform/linux/device/LinuxClock.h"
#include "platform/linux/device/LinuxDeviceConditions.h"
#include "platform/linux/device/LinuxProcessInformation.h"
#include "platform/linux/device/LinuxProcessSampling.h"
#include "platform/linux/drivers/LinuxChanlogFacility.h"
#include "platform/linux/log/LinuxStructuredLog.h"
#include "platform/linux/log/LinuxTracePoints.h"
#include "platform/linux/loop/EventLoop.h"
#include "platform/linux/loop/LinuxSerialQueue.h"
#include "platform/linux/loop/LinuxWorkQueues.h"
#include "platform/linux/settings/LinuxDeviceProperties.h"
#include "platform/linux/settings/LinuxNamedNotifications.h"
#include "platform/linux/settings/LinuxPreferences.h"
#include "platform/linux/sinks/LinuxAnalyticsEventService.h"
#include "platform/linux/sinks/LinuxBugReportDrafting.h"
#include "platform/linux/sinks/LinuxCallQualityService.h"
#include "platform/linux/sinks/LinuxDiagnosticsMetrics.h"
#include "platform/linux/sinks/LinuxPowerEventLog.h"
#include "platform/linux/sinks/LinuxReportFiles.h"

#include <csignal>
#include <cstdlib>
#include <optional>
#include <utility>

#include <sys/epoll.h>
#include <sys/resource.h>
#include <sys/signalfd.h>

namespace tamblo {

namespace {

/// Every client is a descriptor: the process takes as many as it may have.
void raiseDescriptorLimit() noexcept {
    rlimit limit{};
    if (::getrlimit(RLIMIT_NOFILE, &limit) == 0) {
        limit.rlim_cur = limit.rlim_max;
        ::setrlimit(RLIMIT_NOFILE, &limit);
    }
}

} // namespace

/// SIGTERM and SIGINT as a descriptor: the first asks for the end, a second makes it at once.
class LinuxPlatform::Signals final : public EventSource {
public:
    Signals() {
        sigset_t signals;
        sigemptyset(&signals);
        sigaddset(&signals, SIGTERM);
        sigaddset(&signals, SIGINT);
        // A sink that reaches the process's file size limit is a full disk, not the end.
        std::signal(SIGXFSZ, SIG_IGN);
        ::sigprocmask(SIG_BLOCK, &signals, nullptr);
        descriptor_ = FileDescriptor(::signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK));
    }

    void watch(EventLoop& loop, UniqueFunction<void()> endWanted) {
        endWanted_ = std::move(endWanted);
        loop.add(descriptor_.get(), EPOLLIN, *this);
    }

    void ready(std::uint32_t) override {
        signalfd_siginfo signal{};
        while (::read(descriptor_.get(), &signal, sizeof signal) == sizeof signal) {
            if (!endWanted_) {
                std::_Exit(EXIT_SUCCESS);
            }
            std::exchange(endWanted_, UniqueFunction<void()>())();
        }
    }

private:
    FileDescriptor descriptor_;
    UniqueFunction<void()> endWanted_;
};

/// What steers the service and is told by the kernel: preferences and notifications.
class LinuxPlatform::Changes final : public EventSource {
public:
    explicit Changes(UniqueFunction<void()> read) : read_(std::move(read)) {}

    /// Nothing is watched where the kernel gave no descriptor for it.
    void watch(EventLoop& loop, int descriptor) {
        if (descriptor >= 0) {
            loop.add(descriptor, EPOLLIN, *this);
        }
    }
    void ready(std::uint32_t) override { read_(); }
    [[nodiscard]] bool comesFirst() const noexcept override { return true; }

private:
    UniqueFunction<void()> read_;
};

/// In the order in which they depend on each other.
struct LinuxPlatform::Services {
    explicit Services(const Directories& directories)
        : namedNotifications(directories.notifications(), log),
          notificationChanges([this] {
              // A post may tell of a preference that was written just before it.
              namedNotifications.deliverPosts([this] { preferences.readChanges(); });
          }),
          deviceProperties(directories.deviceProperties(), log),
          preferences(directories.preferences(), log),
          preferenceChanges([this] { preferences.readChanges(); }),
          analyticsEvents(directories.logs, clock, preferences, log),
          powerEvents(directories.logs, clock, log),
          diagnosticsMetrics(directories.logs, clock, log),
          callQuality(directories.logs, clock, preferences, workQueues, log),
          reportFiles(directories.logs),
          bugCapture(directories.logs, clock, workQueues, log),
          bugReportDrafting(directories.logs, clock, log),
          memoryLog(directories.logs, clock, workQueues, log),
          chanlog(directories.driverChannels(), log),
          accessories(log),
          connections(loop, log),
          diagnosticCapture(
              directories.logs, clock, workQueues, [this] { return connections.clientProcesses(); }, log) {}
    ~Services() { bugCapture.endSessions(); }
    Services(const Services&) = delete;
    Services& operator=(const Services&) = delete;

    // First, as it makes sure that standard error is open before anything else can take its number.
    LinuxStructuredLog log;
    Signals signals;
    LinuxClock clock;
    LinuxTracePoints tracePoints;
    LinuxProcessInformation processInformation;
    LinuxDeviceConditions deviceConditions;
    LinuxNamedNotifications namedNotifications;
    Changes notificationChanges;
    LinuxDeviceProperties deviceProperties;
    LinuxPreferences preferences;
    Changes preferenceChanges;
    LinuxAnalyticsEventService analyticsEvents;
    LinuxPowerEventLog powerEvents;
    LinuxDiagnosticsMetrics diagnosticsMetrics;
    LinuxCallQualityService callQuality;
    LinuxReportFiles reportFiles;
    LinuxBugCaptureService bugCapture;
    LinuxBugReportDrafting bugReportDrafting;
    LinuxMemoryLog memoryLog;
    LinuxChanlogFacility chanlog;
    LinuxProcessSampling processSampling;
    LinuxAccessories accessories;
    EventLoop loop;
    LinuxConnectionService connections;
    LinuxDiagnosticCapture diagnosticCapture;
    // Behind what its work uses: it works off what was posted before it goes.
    LinuxWorkQueues workQueues;
    std::optional<InlineDrain> drain;
};

std::variant<std::unique_ptr<LinuxPlatform>, std::string> LinuxPlatform::open() {
    raiseDescriptorLimit();
    auto directories = Directories::prepare();
    if (auto* problem = std::get_if<std::string>(&directories)) {
        return std::move(*problem);
    }
    const auto& places = std::get<Directories>(directories);
    std::unique_ptr<LinuxPlatform> platform(new LinuxPlatform(places));
    if (!platform->services_->loop.isOpen()) {
        return "the kernel gives out no more file descriptors: raise the limit on open files";
    }
    if (auto problem = platform->services_->connections.open(places.runtime)) {
        return std::move(*problem);
    }
    return platform;
}

LinuxPlatform::LinuxPlatform(const Directories& directories)
    : services_(std::make_unique<Services>(directories)) {}

LinuxPlatform::~LinuxPlatform() = default;

Platform LinuxPlatform::services() {
    return {.clock = services_->clock,
            .workQueues = services_->workQueues,
            .log = services_->log,
            .tracePoints = services_->tracePoints,
            .deviceProperties = services_->deviceProperties,
            .preferences = services_->preferences,
            .namedNotifications = services_->namedNotifications,
            .processInformation = services_->processInformation,
            .deviceConditions = services_->deviceConditions,
            .analyticsEvents = services_->analyticsEvents,
            .powerEvents = services_->powerEvents,
            .diagnosticsMetrics = services_->diagnosticsMetrics,
            .callQuality = services_->callQuality,
            .reportFiles = services_->reportFiles,
            .bugCapture = services_->bugCapture,
            .bugReportDrafting = services_->bugReportDrafting,
            .diagnosticCapture = services_->diagnosticCapture,
            .memoryLog = services_->memoryLog,
            .chanlog = services_->chanlog,
            .processSampling = services_->processSampling,
            .accessories = services_->accessories,
            .connections = services_->connections};
}

void LinuxPlatform::flushSinks() {
    services_->analyticsEvents.flush();
    services_->powerEvents.flush();
    services_->diagnosticsMetrics.flush();
    services_->bugCapture.flush();
    services_->bugReportDrafting.flush();
}

void LinuxPlatform::run(SerialQueue& requestQueue,
                        const std::function<void(std::function<void()> completion)>& shutDown) {
    Services& all = *services_;
    requestQueue.setBatchEnd([this, &all] {
        flushSinks();
        all.connections.releaseReplies();
    });
    all.workQueues.setTickEnd([this] { flushSinks(); });
    all.connections.setRequestQueue(requestQueue);
    all.loop.setBrackets([&all] { all.drain.emplace(); },
                         [&all] {
                             all.drain.reset();
                             all.callQuality.flush();
                         });
    all.preferenceChanges.watch(all.loop, all.preferences.fileDescriptor());
    all.notificationChanges.watch(all.loop, all.namedNotifications.fileDescriptor());
    all.signals.watch(all.loop, [&all, &shutDown] {
        notifyServiceManager("STOPPING=1");
        all.connections.stop();
        shutDown([&all] { all.loop.post([&all] { all.loop.stop(); }); });
    });
    notifyServiceManager("READY=1");
    all.loop.run();
    flushSinks();
}

} // namespace tamblo
