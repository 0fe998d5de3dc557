#include "platform/linux/LinuxPlatform.h"

#include "base/Format.h"
#include "os/ServiceManager.h"
#include "platform/linux/Health.h"
#include "platform/linux/captures/LinuxBugCaptureService.h"
#include "platform/linux/captures/LinuxDiagnosticCapture.h"
#include "platform/linux/captures/LinuxMemoryLog.h"
#include "platform/linux/connections/LinuxConnectionService.h"
#include "platform/linux/device/LinuxAccessories.h"
#include "platform/linux/device/LinuxClock.h"
#include "platform/linux/device/LinuxDeviceConditions.h"
#include "platform/linux/device/LinuxProcessInformation.h"
#include "platform/linux/drivers/LinuxChanlogFacility.h"
#include "platform/linux/log/LinuxStructuredLog.h"
#include "platform/linux/log/LinuxTracePoints.h"
#include "platform/linux/loop/EventLoop.h"
#include "platform/linux/loop/LinuxWorkQueues.h"
#include "platform/linux/settings/LinuxDeviceProperties.h"
#include "platform/linux/settings/LinuxNamedNotifications.h"
#include "platform/linux/settings/LinuxPreferences.h"
#include "platform/linux/sinks/LineSinks.h"
#include "platform/linux/sinks/LinuxAnalyticsEventService.h"
#include "platform/linux/sinks/LinuxCallQualityService.h"
#include "platform/linux/sinks/LinuxReportFiles.h"
#include "platform/linux/status/CounterFile.h"
#include "platform/linux/status/StatusDocuments.h"
#include "platform/linux/status/StatusSocket.h"
#include "platform/linux/tap/Taps.h"

#include <csignal>
#include <cstdlib>
#include <utility>

#include <malloc.h>
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

/// One heap for all threads: of others, what lies at their end is not given back when it is asked for. What
/// threads free is mostly what another one allocated, so they would meet at its heap in any case.
void useOneHeap() noexcept {
    static_cast<void>(::mallopt(M_ARENA_MAX, 1));
}

} // namespace

/// SIGTERM and SIGINT as a descriptor: the first asks for the end, a second makes it at once.
class LinuxPlatform::Signals final : public EventSource {
public:
    Signals() {
        const sigset_t signals = endingSignals();
        // A sink that reaches the process's file size limit is a full disk, not the end.
        std::signal(SIGXFSZ, SIG_IGN);
        ::sigprocmask(SIG_BLOCK, &signals, nullptr);
        descriptor_ = FileDescriptor(::signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK));
    }

    [[nodiscard]] bool watch(EventLoop& loop) { return loop.add(descriptor_.get(), EPOLLIN, *this); }
    void setEndWanted(UniqueFunction<void()> endWanted) { endWanted_ = std::move(endWanted); }
    /// From now on, when nobody reads the descriptor any more, each ends the process.
    static void letEnd() {
        const sigset_t signals = endingSignals();
        ::sigprocmask(SIG_UNBLOCK, &signals, nullptr);
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
    static sigset_t endingSignals() {
        sigset_t signals;
        sigemptyset(&signals);
        sigaddset(&signals, SIGTERM);
        sigaddset(&signals, SIGINT);
        return signals;
    }

    FileDescriptor descriptor_;
    UniqueFunction<void()> endWanted_;
};

/// What steers the service and is told by the kernel: preferences and notifications.
class LinuxPlatform::Changes final : public EventSource {
public:
    explicit Changes(UniqueFunction<void()> read) : read_(std::move(read)) {}

    /// Nothing is watched where the kernel gave no descriptor for it.
    [[nodiscard]] bool watch(EventLoop& loop, int descriptor) {
        return descriptor < 0 || loop.add(descriptor, EPOLLIN, *this);
    }
    void ready(std::uint32_t) override { read_(); }
    [[nodiscard]] bool comesFirst() const noexcept override { return true; }

private:
    UniqueFunction<void()> read_;
};

struct LinuxPlatform::Services {
    explicit Services(const wire::Directories& places) : directories(places) {}
    ~Services() {
        bugCapture.endSessions();
        // What was posted is worked off while everything is there, and what the loop drives goes before it.
        platform.workQueues.reset();
        platform.diagnosticCapture.reset();
        platform.connections.reset();
        platform.messageTap.reset();
    }
    [[nodiscard]] bool watch() {
        return loop.isOpen() && preferenceChanges.watch(loop, preferences.fileDescriptor()) &&
               notificationChanges.watch(loop, namedNotifications.fileDescriptor()) && signals.watch(loop);
    }
    Services(const Services&) = delete;
    Services& operator=(const Services&) = delete;
    [[nodiscard]] const Limits& readLimits() {
        platform.limits = Limits::read(preferences);
        return platform.limits;
    }
    /// What it is doing, in a line for people.
    [[nodiscard]] std::string status() {
        const Activity& activity = *platform.activity;
        std::string text =
            formatted("{} clients, {} sessions", connections.connectionCount(), activity.sessions.load());
        if (const auto dropped = activity.droppedRecords.load(); dropped != 0) {
            appendFormatted(text, ", {} retained records let go", dropped);
        }
        if (const auto lost = sinkFiles->lostLines(); lost != 0) {
            appendFormatted(text, ", {} lines lost", lost);
        }
        for (const std::vector<std::string>& out : {sinkFiles->out(), directoriesOut()}) {
            for (const std::string& sink : out) {
                appendFormatted(text, ", {} is out", sink);
            }
        }
        return text;
    }
    /// Those that could not be written when that was last tried.
    [[nodiscard]] std::vector<std::string> directoriesOut() const {
        std::vector<std::string> out;
        if (reportFiles.isOut()) {
            out.emplace_back("DiagnosticLogs/");
        }
        if (bugCapture.isOut()) {
            out.emplace_back("captures/");
        }
        return out;
    }

    const wire::Directories directories;
    std::optional<SinkFiles> sinkFiles; ///< outlives the services that write them
    Platform platform;
    // First, as it makes sure that standard error is open before anything else can take its number.
    LinuxStructuredLog& log = provide<LinuxStructuredLog>(platform.log);
    Signals signals;
    EventLoop loop;
    LinuxClock& clock = provide<LinuxClock>(platform.clock);
    LinuxWorkQueues& workQueues = provide<LinuxWorkQueues>(platform.workQueues);
    LinuxTracePoints& tracePoints = provide<LinuxTracePoints>(platform.tracePoints);
    LinuxProcessInformation& processInformation =
        provide<LinuxProcessInformation>(platform.processInformation);
    LinuxDeviceConditions& deviceConditions = provide<LinuxDeviceConditions>(platform.deviceConditions);
    LinuxNamedNotifications& namedNotifications =
        provide<LinuxNamedNotifications>(platform.namedNotifications, directories.notifications(), log);
    LinuxDeviceProperties& deviceProperties =
        provide<LinuxDeviceProperties>(platform.deviceProperties, directories.deviceProperties(), log);
    LinuxPreferences& preferences =
        provide<LinuxPreferences>(platform.preferences, directories.preferences(), log);
    const Limits& limits = readLimits();
    const FileModes fileModes = FileModes::read(preferences, log);
    SinkFiles& sinks = sinkFiles.emplace(directories.logs, log, FileOperations::system(), fileModes);
    LinuxAnalyticsEventService& analyticsEvents =
        provide<LinuxAnalyticsEventService>(platform.analyticsEvents, sinks, clock, preferences, log);
    LinuxPowerEventLog& powerEvents = provide<LinuxPowerEventLog>(platform.powerEvents, sinks, clock);
    LinuxDiagnosticsMetrics& diagnosticsMetrics =
        provide<LinuxDiagnosticsMetrics>(platform.diagnosticsMetrics, sinks, clock);
    LinuxCallQualityService& callQuality =
        provide<LinuxCallQualityService>(platform.callQuality, sinks, clock, preferences, workQueues, log);
    LinuxReportFiles& reportFiles = provide<LinuxReportFiles>(
        platform.reportFiles, directories.logs, clock, log, fileModes, ReportLimits::read(preferences));
    LinuxBugCaptureService& bugCapture = provide<LinuxBugCaptureService>(
        platform.bugCapture, sinks, directories.logs + "/captures", clock, workQueues, log, fileModes);
    LinuxBugReportDrafting& bugReportDrafting =
        provide<LinuxBugReportDrafting>(platform.bugReportDrafting, sinks, clock);
    LinuxMemoryLog& memoryLog = provide<LinuxMemoryLog>(platform.memoryLog, sinks, clock, workQueues, log);
    LinuxChanlogFacility& chanlog =
        provide<LinuxChanlogFacility>(platform.chanlog, directories.driverChannels(), log);
    LinuxProcessSampling& processSampling = provide<LinuxProcessSampling>(platform.processSampling);
    LinuxAccessories& accessories =
        provide<LinuxAccessories>(platform.accessories, log, directories.accessories());
    LinuxConnectionService& connections =
        provide<LinuxConnectionService>(platform.connections, loop, clock, log, limits);
    LinuxDiagnosticCapture& diagnosticCapture = provide<LinuxDiagnosticCapture>(
        platform.diagnosticCapture, sinks, clock, workQueues,
        [this] { return connections.clientProcesses(); }, log);
    Taps& taps = provide<Taps>(platform.messageTap, loop);

    CounterFile counterFile;
    StatusDocuments statusDocuments{
        {.loop = loop,
         .workQueues = workQueues,
         .log = log,
         .directories = directories,
         .preferences = preferences,
         .limits = limits,
         .fileModes = fileModes,
         .sinks = sinks,
         .activity = *platform.activity,
         .connections = connections,
         .furtherOut = [this] { return directoriesOut(); },
         .isInternalBuild = [this] { return deviceProperties.booleanProperty("InternalBuild"); }}};
    StatusSocket statusSocket{loop, workQueues, log, statusDocuments};
    Health health{loop, [this] { return status(); }};
    Changes notificationChanges{[this] {
        // A post may tell of a preference that was written just before it.
        namedNotifications.deliverPosts([this] { preferences.readChanges(); });
    }};
    Changes preferenceChanges{[this] { preferences.readChanges(); }};
};

std::variant<std::unique_ptr<LinuxPlatform>, std::string> LinuxPlatform::open() {
    raiseDescriptorLimit();
    useOneHeap();
    auto directories = wire::Directories::prepare();
    if (auto* problem = std::get_if<std::string>(&directories)) {
        return std::move(*problem);
    }
    const auto& places = std::get<wire::Directories>(directories);
    std::unique_ptr<LinuxPlatform> platform(new LinuxPlatform(places));
    if (!platform->services_->watch()) {
        return "the kernel gives out no more file descriptors: raise the limit on open files";
    }
    Services& all = *platform->services_;
    if (auto problem = all.connections.open(places.runtime)) {
        return std::move(*problem);
    }
    if (const auto problem = all.statusSocket.open(places.runtime)) {
        // Its clients need it all the same.
        all.log.report(LogLevel::error, "zrrs", formatted("nobody is told the status: {}", *problem));
    }
    ListeningSocket::forgetPassedOn();
    all.counterFile.open(places.runtime, all.log);
    counters::add(counters::Counter::starts);
    return platform;
}

LinuxPlatform::LinuxPlatform(const wire::Directories& directories)
    : services_(std::make_unique<Services>(directories)) {}

LinuxPlatform::~LinuxPlatform() = default;

const Platform& LinuxPlatform::services() const noexcept {
    return services_->platform;
}

void LinuxPlatform::showStatus(StatusSource& source, std::string version) {
    services_->statusDocuments.setSource(source, services_->counterFile, std::move(version));
    services_->statusSocket.setTaps(
        [&taps = services_->taps](FileDescriptor reader, std::string_view filter) {
            taps.add(std::move(reader), filter);
        });
    services_->statusSocket.resume();
}

void LinuxPlatform::run(SerialQueue& serverQueue,
                        const std::function<void(std::function<void()> completion)>& shutDown) {
    Services& all = *services_;
    const auto endCallQuality = [&all] {
        if (const auto delay = all.callQuality.endRun()) {
            all.loop.post(
                [&all, delay] { all.loop.callAfter(*delay, [&all] { all.callQuality.writeHeldBack(); }); });
        }
    };
    serverQueue.setBatchEnd([&all, endCallQuality] {
        all.sinks.flush();
        all.connections.releaseReplies();
        endCallQuality();
        all.health.update();
    });
    all.loop.setTurns([&all] { return all.connections.readSome(); });
    all.workQueues.setHelper([&all](std::chrono::milliseconds delay) {
        all.loop.post([&all, delay] { all.loop.callAfter(delay, [&all] { all.workQueues.help(); }); });
    });
    all.workQueues.setRunEnd(endCallQuality);
    all.connections.setServerQueue(serverQueue, all.workQueues);
    all.signals.setEndWanted([&all, &shutDown] {
        notifyServiceManager("STOPPING=1");
        all.statusSocket.stop();
        // What clients sent before the signal is read first, as far as it came with the same wake-up.
        all.loop.post([&all, &shutDown] {
            all.connections.stop();
            shutDown([&all] { all.loop.post([&all] { all.loop.stop(); }); });
        });
    });
    notifyServiceManager("READY=1");
    all.health.watch(serverQueue);
    all.loop.run(all.workQueues);
    all.signals.letEnd();
    // What ended the loop may have left more for the queues, which the service has to outlive.
    all.workQueues.workOff();
    all.connections.letGo();
    all.loop.dropTasks();
    all.sinks.flush();
}

} // namespace tamblo
