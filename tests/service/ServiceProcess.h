#pragma once

#include "tests/Files.h"
#include "tests/Sockets.h"

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <optional>
#include <thread>
#include <utility>

#include <fcntl.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

namespace tamblo::test {

inline constexpr std::chrono::duration<int, std::milli> kPatience{20'000};

/// What a command of the shell wrote, its complaints too, and its exit status.
struct CommandResult {
    std::string output;
    int status;
};
[[nodiscard]] inline CommandResult run(const std::string& command) {
    CommandResult done{};
    std::FILE* pipe = ::popen((command + " 2>&1").c_str(), "r");
    for (int byte = std::fgetc(pipe); byte != EOF; byte = std::fgetc(pipe)) {
        done.output += static_cast<char>(byte);
    }
    done.status = WEXITSTATUS(::pclose(pipe));
    return done;
}

/// Until the condition holds, at most some seconds.
template <typename Condition> [[nodiscard]] bool eventually(const Condition& condition) {
    const auto end = std::chrono::steady_clock::now() + kPatience;
    while (!condition()) {
        if (std::chrono::steady_clock::now() > end) {
            return false;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
    return true;
}

[[nodiscard]] inline std::size_t countOf(std::string_view part, std::string_view text) {
    std::size_t count = 0;
    for (std::size_t at = text.find(part); at != std::string_view::npos; at = text.find(part, at + 1)) {
        ++count;
    }
    return count;
}

/// The domain of the preferences by which an internal build captures and drafts.
inline constexpr const char* kCaptures = "com.vandra.tamblo.zrreporting";

/// A real `tamblod` in directories of its own, which are removed with it. Its standard error goes to a file
/// there.
class ServiceProcess {
public:
    struct Options {
        bool isInternalBuild = false;
        /// JSON objects by domain.
        std::vector<std::pair<std::string, std::string>> preferences{};
        /// Added to the environment, the directories' variables among them if they are to differ.
        std::vector<std::pair<std::string, std::string>> environment{};
        /// Called in the child between fork and exec.
        std::function<void()> beforeExec{};
        /// Without it, the constructor returns before the service is ready.
        bool awaitsReady = true;
    };

    ServiceProcess() : ServiceProcess(Options()) {}
    explicit ServiceProcess(Options options) : options_(std::move(options)) {
        if (options_.isInternalBuild) {
            directory_.write("config/device-properties.json", R"({"InternalBuild": true})");
        }
        for (const auto& [domain, values] : options_.preferences) {
            writeFile(preferenceFile(domain), values);
        }
        start();
    }
    ~ServiceProcess() {
        signal(SIGKILL);
        (void)awaitEnd();
    }
    ServiceProcess(const ServiceProcess&) = delete;
    ServiceProcess& operator=(const ServiceProcess&) = delete;

    /// Starts it (again), in the same directories.
    void start() {
        // On which the service says that it is ready, as it would to a service manager.
        std::filesystem::remove(directory_.path("ready"));
        pollfd ready{.fd = boundSocket(SOCK_DGRAM, directory_.path("ready")), .events = POLLIN, .revents = 0};
        pid_ = ::fork();
        if (pid_ == 0) {
            prepareChild();
            ::execl(TAMBLOD_PATH, "tamblod", nullptr);
            ::_exit(127);
        }
        const bool isReady = !options_.awaitsReady || ::poll(&ready, 1, kPatience.count()) == 1;
        ::close(ready.fd);
        if (!isReady) {
            throw std::runtime_error("tamblod does not get ready: " + errorOutput());
        }
    }
    /// Nothing to a service that has ended.
    void signal(int number) const {
        if (pid_ > 0) {
            ::kill(pid_, number);
        }
    }
    /// Waits for its end, at most some seconds; the exit status, or minus the signal, or nothing when it runs
    /// on or had ended before.
    [[nodiscard]] std::optional<int> awaitEnd() {
        int status = 0;
        if (pid_ <= 0 || !eventually([this, &status] { return ::waitpid(pid_, &status, WNOHANG) == pid_; })) {
            return std::nullopt;
        }
        pid_ = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
    }
    /// SIGTERM, and the exit status.
    std::optional<int> stop() {
        signal(SIGTERM);
        return awaitEnd();
    }
    /// From now on.
    void limit(__rlimit_resource resource, rlim_t most) const {
        rlimit limits{};
        ::prlimit(pid_, resource, nullptr, &limits);
        limits.rlim_cur = most;
        ::prlimit(pid_, resource, &limits, nullptr);
    }

    [[nodiscard]] pid_t pid() const noexcept { return pid_; }
    [[nodiscard]] std::filesystem::path logs() const { return directory_.path("logs"); }
    [[nodiscard]] std::string runtimeDirectory() const { return directory_.path("run"); }
    [[nodiscard]] std::string socketPath() const {
        return runtimeDirectory() + "/com.vandra.tamblo.reporting";
    }
    [[nodiscard]] std::filesystem::path preferenceFile(const std::string& domain) const {
        return directory_.path("config/preferences/" + domain + ".json");
    }
    /// What it wrote to standard error.
    [[nodiscard]] std::string errorOutput() const { return directory_.read("stderr"); }
    /// How many lines of the analytics sink have the text.
    [[nodiscard]] std::size_t countEvents(std::string_view text) const {
        const auto lines = linesOf(logs() / "analytics-events.jsonl");
        return static_cast<std::size_t>(std::ranges::count_if(
            lines, [text](const std::string& line) { return line.find(text) != line.npos; }));
    }

    /// A command that runs `tambloctl` with the service's directories.
    [[nodiscard]] std::string tambloctlCommand(const std::string& arguments) const {
        return "RUNTIME_DIRECTORY=" + runtimeDirectory() +
               " CONFIGURATION_DIRECTORY=" + directory_.path("config") +
               " LOGS_DIRECTORY=" + logs().string() + " timeout 20 " TAMBLOCTL_PATH " " + arguments;
    }
    [[nodiscard]] CommandResult tambloctl(const std::string& arguments) const {
        return run(tambloctlCommand(arguments));
    }

private:
    void prepareChild() const {
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
        if (options_.beforeExec) {
            options_.beforeExec();
        }
    }

    const TemporaryDirectory directory_;
    const Options options_;
    pid_t pid_ = -1;
};

} // namespace tamblo::test
