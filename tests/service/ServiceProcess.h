#pragma once

#include "tests/Files.h"

#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <sys/types.h>

namespace tamblo::test {

/// What a command of the shell wrote, and its exit status.
struct CommandResult {
    std::string output;
    int status;
};
[[nodiscard]] CommandResult run(const std::string& command);

/// Until the condition holds, at most some seconds.
[[nodiscard]] bool eventually(const std::function<bool()>& condition);

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

    ServiceProcess();
    explicit ServiceProcess(Options options);
    ~ServiceProcess();
    ServiceProcess(const ServiceProcess&) = delete;
    ServiceProcess& operator=(const ServiceProcess&) = delete;

    /// Starts it (again), in the same directories.
    void start();
    /// Nothing to a service that has ended.
    void signal(int number) const;
    /// Waits for its end, at most some seconds; the exit status, or minus the signal, or nothing when it runs
    /// on or had ended before.
    [[nodiscard]] std::optional<int> awaitEnd();
    /// SIGTERM, and the exit status.
    std::optional<int> stop();

    [[nodiscard]] pid_t pid() const noexcept { return pid_; }
    [[nodiscard]] std::filesystem::path directory() const { return directory_.path(); }
    [[nodiscard]] std::filesystem::path logs() const { return directory() / "logs"; }
    [[nodiscard]] std::string runtimeDirectory() const { return directory() / "run"; }
    [[nodiscard]] std::string socketPath() const;
    [[nodiscard]] std::filesystem::path preferenceFile(std::string_view domain) const;
    /// Runs `tambloctl` with the service's directories; what it writes, its complaints too.
    [[nodiscard]] CommandResult tambloctl(const std::string& arguments) const;
    /// The command for that.
    [[nodiscard]] std::string tambloctlCommand(const std::string& arguments) const;
    /// What it wrote to standard error.
    [[nodiscard]] std::string errorOutput() const;
    /// Until the text stands in standard error, at most some seconds.
    [[nodiscard]] bool awaitErrorOutput(std::string_view text) const;
    /// How many lines of the analytics sink have the text.
    [[nodiscard]] std::size_t countEvents(std::string_view text) const;

private:
    const TemporaryDirectory directory_;
    Options options_;
    pid_t pid_ = -1;
};

[[nodiscard]] std::size_t countOf(std::string_view part, std::string_view text);

} // namespace tamblo::test
