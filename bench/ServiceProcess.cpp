#include "ServiceProcess.h"

#include "Processes.h"
#include "os/FileDescriptor.h"
#include "os/LocalAddress.h"
#include "wire/Protocol.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <string_view>
#include <system_error>
#include <thread>

#include <fcntl.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace tamblo::bench {

namespace {

constexpr std::chrono::seconds kStartLimit{10};
constexpr std::chrono::seconds kStopLimit{60};

[[noreturn]] void fail(const std::string& what) {
    throw std::system_error(errno, std::generic_category(), what);
}

/// Where the service announces that it is ready.
FileDescriptor bindNotifySocket(const std::string& path) {
    FileDescriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    const auto address = LocalAddress::of(path);
    if (!address) {
        throw std::runtime_error("the path of the temporary directory is too long for a socket; set TMPDIR");
    }
    if (!socket.isOpen() || ::bind(socket.get(), address->get(), address->size()) != 0) {
        fail(path);
    }
    return socket;
}

/// One driver's channels, twenty of them; each has gained so much.
std::string driverChannels(int driver, std::int64_t gain) {
    std::string channels = "[";
    for (int i = 0; i < 20; ++i) {
        const std::string name = "\"driver\": \"driver" + std::to_string(driver) +
                                 "\", \"group\": \"Haptics\", \"subgroup\": \"Stats\", \"name\": \"channel " +
                                 std::to_string(i) + "\", \"unit\": \"ms\", ";
        const auto gained = [gain](std::int64_t value) { return std::to_string(value + gain); };
        const std::string figures[] = {
            R"("format": "simple", "value": )" + gained(12345),
            R"("format": "state", "states": [{"name": "idle", "transitions": 12, "residency": )" +
                gained(99000) + R"(}, {"name": "running", "transitions": 12, "residency": )" + gained(1234) +
                "}]",
            R"("format": "histogram", "buckets": [{"lower": 0, "upper": 100, "hits": )" + gained(5) +
                R"(}, {"lower": 100, "upper": 200, "hits": )" + gained(17) + R"(}], "min": 3, "max": 177)",
        };
        channels += (i == 0 ? "{" : ",\n{") + name + figures[i % 3] + "}";
    }
    return channels + "]\n";
}

/// Each driver's file under its name at once, as a driver replaces it.
void publishDrivers(const TemporaryDirectory& directory, std::int64_t gain) {
    constexpr int kDrivers = 10;
    directory.makeDirectory("runtime/chanlog");
    for (int driver = 0; driver < kDrivers; ++driver) {
        const std::string name = "runtime/chanlog/driver" + std::to_string(driver);
        directory.write(name + ".next", driverChannels(driver, gain));
        std::filesystem::rename(directory.path() + "/" + name + ".next",
                                directory.path() + "/" + name + ".json");
    }
}

void makeInternalBuild(const TemporaryDirectory& directory) {
    directory.write("configuration/device-properties.json",
                    R"({"InternalBuild": true, "HapticLeakCapture": true})");
    directory.write("configuration/preferences/com.vandra.tamblo.zrreporting.json",
                    R"({"enable_stackburst": true, "TalvixInvalidXyBackOffSeconds": 3600})");
}

} // namespace

ServiceProcess::ServiceProcess(const Settings& settings) : directory_(settings.directory) {
    directory_.makeDirectory("runtime");
    directory_.makeDirectory("configuration/preferences");
    directory_.makeDirectory("logs");
    socketPath_ = wire::socketPath(directory_.path() + "/runtime");
    if (settings.eventsInUse) {
        directory_.write("configuration/preferences/com.vandra.tamblo.analytics.json",
                         "{\"events_in_use\": " + *settings.eventsInUse + "}\n");
    }
    if (settings.callQualityBackends) {
        directory_.write("configuration/preferences/com.vandra.tamblo.callquality.json",
                         "{\"backends\": " + *settings.callQualityBackends + "}\n");
    }
    if (settings.retainedBytes) {
        const std::string bytes = std::to_string(*settings.retainedBytes);
        directory_.write("configuration/preferences/com.vandra.tamblo.limits.json",
                         "{\"retained_bytes_of_user\": " + bytes + ", \"retained_bytes\": " + bytes + "}\n");
    }
    if (settings.isInternalBuild) {
        makeInternalBuild(directory_);
        if (settings.hasDrivers) {
            publishDrivers(directory_, driversGain_);
        }
    }
    if (settings.isForOtherUsers) {
        for (const std::string& path : {directory_.path(), directory_.path() + "/runtime"}) {
            ::chmod(path.c_str(), 0711);
        }
    }
    const std::string notifyPath = directory_.path() + "/notify";
    const FileDescriptor notify = bindNotifySocket(notifyPath);
    start(settings, notifyPath);
    try {
        waitUntilReady(notify.get());
        if (settings.isForOtherUsers) {
            ::chmod(socketPath_.c_str(), 0666);
        }
    } catch (...) {
        // None is left of a service that has ended at once.
        if (pid_ > 0) {
            ::kill(pid_, SIGKILL);
            ::waitpid(pid_, nullptr, 0);
        }
        throw;
    }
}

ServiceProcess::~ServiceProcess() {
    try {
        stop();
    } catch (const std::exception& error) {
        std::fprintf(stderr, "tamblo_bench: %s\n", error.what());
    }
}

std::chrono::nanoseconds ServiceProcess::age() const noexcept {
    return std::chrono::steady_clock::now() - startedAt_;
}

void ServiceProcess::start(const Settings& settings, const std::string& notifySocket) {
    const FileDescriptor log(::open(logPath().c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600));
    if (!log.isOpen()) {
        fail(logPath());
    }
    std::array<std::string, 5> variables{
        "RUNTIME_DIRECTORY=" + directory_.path() + "/runtime",
        "CONFIGURATION_DIRECTORY=" + directory_.path() + "/configuration",
        "LOGS_DIRECTORY=" + directory_.path() + "/logs",
        "NOTIFY_SOCKET=" + notifySocket,
        "TAMBLO_LOG=default",
    };
    std::array<char*, variables.size() + 1> environment{};
    for (std::size_t i = 0; i < variables.size(); ++i) {
        environment[i] = variables[i].data();
    }
    std::string program = settings.program;
    std::array<char*, 2> arguments{program.data(), nullptr};
    const cpu_set_t processors = processorSet(settings.processor);
    const pid_t parent = ::getpid();

    startedAt_ = std::chrono::steady_clock::now();
    pid_ = ::fork();
    if (pid_ < 0) {
        fail("fork");
    }
    if (pid_ == 0) {
        if (settings.beforeExec) {
            settings.beforeExec(directory_.path());
        }
        ::prctl(PR_SET_PDEATHSIG, SIGKILL);
        if (::getppid() == parent && ::sched_setaffinity(0, sizeof processors, &processors) == 0 &&
            ::dup2(log.get(), STDERR_FILENO) >= 0) {
            ::execve(program.c_str(), arguments.data(), environment.data());
        }
        ::_exit(127);
    }
}

void ServiceProcess::waitUntilReady(int notifySocket) {
    while (age() < kStartLimit) {
        pollfd waiting{notifySocket, POLLIN, 0};
        if (::poll(&waiting, 1, 50) > 0) {
            std::array<char, 256> text{};
            const ssize_t count = ::recv(notifySocket, text.data(), text.size(), 0);
            if (count > 0 && std::string_view(text.data(), static_cast<std::size_t>(count)).find("READY=1") !=
                                 std::string_view::npos) {
                timeUntilReady_ = age();
                return;
            }
        }
        if (::waitpid(pid_, nullptr, WNOHANG) == pid_) {
            pid_ = -1;
            throw std::runtime_error("the service ended at once: " + logTail());
        }
    }
    throw std::runtime_error("the service does not get ready: " + logTail());
}

void ServiceProcess::advanceDrivers() {
    publishDrivers(directory_, driversGain_ += 3);
}

void ServiceProcess::awaitIdle() const {
    constexpr std::chrono::milliseconds kStillness{100};
    constexpr int kMost = 600;
    std::chrono::nanoseconds before{-1};
    for (int i = 0; i < kMost; ++i) {
        const std::chrono::nanoseconds now = cpuTimeOf(pid_);
        if (now == before) {
            return;
        }
        before = now;
        std::this_thread::sleep_for(kStillness);
    }
    throw std::runtime_error("the service does not come to rest");
}

bool ServiceProcess::isAlive() const noexcept {
    siginfo_t ended{};
    return pid_ > 0 && ::waitid(P_PID, static_cast<id_t>(pid_), &ended, WEXITED | WNOHANG | WNOWAIT) == 0 &&
           ended.si_pid != pid_;
}

/// Takes the service's end in; kills it when the time is over, and answers false.
bool ServiceProcess::awaitEnd(std::chrono::seconds limit, int& status) {
    const pid_t process = std::exchange(pid_, -1);
    const auto end = std::chrono::steady_clock::now() + limit;
    while (::waitpid(process, &status, WNOHANG) == 0) {
        if (std::chrono::steady_clock::now() > end) {
            ::kill(process, SIGKILL);
            ::waitpid(process, &status, 0);
            return false;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
    return true;
}

std::optional<std::chrono::nanoseconds> ServiceProcess::terminate(std::chrono::seconds limit) {
    if (pid_ <= 0) {
        return std::nullopt;
    }
    const auto begin = std::chrono::steady_clock::now();
    ::kill(pid_, SIGTERM);
    int status = 0;
    const bool isEnded = awaitEnd(limit, status) && WIFEXITED(status) && WEXITSTATUS(status) == 0;
    return isEnded ? std::optional(std::chrono::steady_clock::now() - begin) : std::nullopt;
}

void ServiceProcess::stop() {
    if (pid_ < 0) {
        return;
    }
    ::kill(pid_, SIGTERM);
    int status = 0;
    if (!awaitEnd(kStopLimit, status) || !WIFEXITED(status) || WEXITSTATUS(status) != 0) {
        throw std::runtime_error("the service did not end in order: " + logTail());
    }
}

std::size_t ServiceProcess::countLines(std::string_view file, std::string_view text) const {
    std::size_t count = 0;
    for (const std::string_view age : {"", ".1", ".2", ".3", ".4"}) {
        std::ifstream lines(logsDirectory() + "/" + std::string(file) + std::string(age), std::ios::binary);
        for (std::string line; std::getline(lines, line);) {
            count += line.find(text) != std::string::npos ? 1 : 0;
        }
    }
    return count;
}

std::size_t ServiceProcess::countEvents(std::string_view name) const {
    return countLines("analytics-events.jsonl", "\"event\":\"" + std::string(name) + "\"");
}

std::string ServiceProcess::logTail() const {
    constexpr std::size_t kCharacters = 400;
    std::ifstream file(logPath(), std::ios::binary);
    std::ostringstream text;
    text << file.rdbuf();
    const std::string all = text.str();
    return all.size() > kCharacters ? all.substr(all.size() - kCharacters) : all;
}

} // namespace tamblo::bench
