#pragma once

#include "tests/Files.h"

#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <sys/resource.h>
#include <sys/types.h>

namespace tamblo::test {

/// What a command of the shell wrote, its complaints too, and its exit status.
struct CommandResult {
    std::string output;
    int status;
};
[[nodiscard]] CommandResult run(const std::string& command);

/// Until the condition holds, at most some seconds.
[[nodiscard]] bool eventually(const std::function<bool()>& condition);

[[nodiscard]] std::size_t countOf(std::string_view part, std::string_view text);

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
        /// Bytes of a file, until that is lifted.
        rlim_t fileSizeLimit = RLIM_INFINITY;
        rlim_t descriptorLimit = 1024;
        /// Called in the child between fork and exec.
        std::function<void()> beforeExec{};
        /// Without it, the constructor returns before the service is ready.
        bool awaitsReady = true;
    };

    ServiceProcess() : ServiceProcess(Options()) {}
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
    void liftFileSizeLimit() const;

    [[nodiscard]] pid_t pid() const noexcept { return pid_; }
    [[nodiscard]] std::filesystem::path logs() const { return directory_.path("logs"); }
    [[nodiscard]] std::string runtimeDirectory() const { return directory_.path("run"); }
    [[nodiscard]] std::string socketPath() const;
    [[nodiscard]] std::filesystem::path preferenceFile(std::string_view domain) const;
    /// What it wrote to standard error.
    [[nodiscard]] std::string errorOutput() const { return directory_.read("stderr"); }
    /// How many lines of the analytics sink have the text.
    [[nodiscard]] std::size_t countEvents(std::string_view text) const;

    /// A command that runs `tambloctl` with the service's directories.
    [[nodiscard]] std::string tambloctlCommand(const std::string& arguments) const;
    [[nodiscard]] CommandResult tambloctl(const std::string& arguments) const;

private:
    const TemporaryDirectory directory_;
    const Options options_;
    pid_t pid_ = -1;
};

} // namespace tamblo::test
