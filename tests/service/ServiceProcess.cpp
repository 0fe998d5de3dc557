#include "tests/service/ServiceProcess.h"

#include "tests/Sockets.h"

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <stdexcept>
#include <thread>

#include <fcntl.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace tamblo::test {

namespace {

constexpr std::chrono::duration<int, std::milli> kPatience{20'000};
constexpr std::chrono::milliseconds kPause{2};

void limit(__rlimit_resource resource, rlim_t soft, rlim_t hard, pid_t process = 0) {
    const rlimit limits{soft, hard};
    ::prlimit(process, resource, &limits, nullptr);
}

} // namespace

CommandResult run(const std::string& command) {
    CommandResult done{};
    std::FILE* pipe = ::popen((command + " 2>&1").c_str(), "r");
    for (int byte = std::fgetc(pipe); byte != EOF; byte = std::fgetc(pipe)) {
        done.output += static_cast<char>(byte);
    }
    done.status = WEXITSTATUS(::pclose(pipe));
    return done;
}

bool eventually(const std::function<bool()>& condition) {
    const auto end = std::chrono::steady_clock::now() + kPatience;
    while (!condition()) {
        if (std::chrono::steady_clock::now() > end) {
            return false;
        }
        std::this_thread::sleep_for(kPause);
    }
    return true;
}

std::size_t countOf(std::string_view part, std::string_view text) {
    std::size_t count = 0;
    for (std::size_t at = text.find(part); at != std::string_view::npos; at = text.find(part, at + 1)) {
        ++count;
    }
    return count;
}

ServiceProcess::ServiceProcess(Options options) : options_(std::move(options)) {
    if (options_.isInternalBuild) {
        writeFile(directory_.path("config/device-properties.json"), R"({"InternalBuild": true})");
    }
    for (const auto& [domain, values] : options_.preferences) {
        writeFile(preferenceFile(domain), values);
    }
    start();
}

ServiceProcess::~ServiceProcess() {
    signal(SIGKILL);
    (void)awaitEnd();
}

void ServiceProcess::start() {
    // On which the service says that it is ready, as it would to a service manager.
    std::filesystem::remove(directory_.path("ready"));
    pollfd ready{.fd = boundSocket(SOCK_DGRAM, directory_.path("ready")), .events = POLLIN, .revents = 0};
    pid_ = ::fork();
    if (pid_ == 0) {
        ::prctl(PR_SET_PDEATHSIG, SIGKILL);
        ::setenv("RUNTIME_DIRECTORY", runtimeDirectory().c_str(), 1);
        ::setenv("CONFIGURATION_DIRECTORY", directory_.path("config").c_str(), 1);
        ::setenv("LOGS_DIRECTORY", logs().c_str(), 1);
        ::setenv("NOTIFY_SOCKET", directory_.path("ready").c_str(), 1);
        ::unsetenv("TAMBLO_LOG");
        for (const auto& [name, value] : options_.environment) {
            ::setenv(name.c_str(), value.c_str(), 1);
        }
        ::dup2(::open(directory_.path("stderr").c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600), STDERR_FILENO);
        limit(RLIMIT_FSIZE, options_.fileSizeLimit, RLIM_INFINITY);
        limit(RLIMIT_NOFILE, options_.descriptorLimit, options_.descriptorLimit);
        if (options_.beforeExec) {
            options_.beforeExec();
        }
        ::execl(TAMBLOD_PATH, "tamblod", nullptr);
        ::_exit(127);
    }
    const bool isReady = !options_.awaitsReady || ::poll(&ready, 1, kPatience.count()) == 1;
    ::close(ready.fd);
    if (!isReady) {
        throw std::runtime_error("tamblod does not get ready: " + errorOutput());
    }
}

void ServiceProcess::signal(int number) const {
    if (pid_ > 0) {
        ::kill(pid_, number);
    }
}

std::optional<int> ServiceProcess::awaitEnd() {
    int status = 0;
    if (pid_ <= 0 || !eventually([this, &status] { return ::waitpid(pid_, &status, WNOHANG) == pid_; })) {
        return std::nullopt;
    }
    pid_ = -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
}

std::optional<int> ServiceProcess::stop() {
    signal(SIGTERM);
    return awaitEnd();
}

void ServiceProcess::liftFileSizeLimit() const {
    limit(RLIMIT_FSIZE, RLIM_INFINITY, RLIM_INFINITY, pid_);
}

std::string ServiceProcess::socketPath() const {
    return runtimeDirectory() + "/com.vandra.tamblo.reporting";
}

std::filesystem::path ServiceProcess::preferenceFile(std::string_view domain) const {
    return directory_.path("config/preferences/" + std::string(domain) + ".json");
}

std::string ServiceProcess::tambloctlCommand(const std::string& arguments) const {
    return "RUNTIME_DIRECTORY=" + runtimeDirectory() +
           " CONFIGURATION_DIRECTORY=" + directory_.path("config") + " LOGS_DIRECTORY=" + logs().string() +
           " timeout 20 " TAMBLOCTL_PATH " " + arguments;
}

CommandResult ServiceProcess::tambloctl(const std::string& arguments) const {
    return run(tambloctlCommand(arguments));
}

std::size_t ServiceProcess::countEvents(std::string_view text) const {
    const auto lines = linesOf(logs() / "analytics-events.jsonl");
    return static_cast<std::size_t>(
        std::count_if(lines.begin(), lines.end(),
                      [text](const std::string& line) { return line.find(text) != std::string::npos; }));
}

} // namespace tamblo::test
