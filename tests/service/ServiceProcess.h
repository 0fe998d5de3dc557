#pragma once

#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <sys/types.h>
#include <sys/un.h>

namespace tamblo::test {

/// A real `tamblod` in directories of its own, which are removed with it. Its standard error goes to a file
/// there.
class ServiceProcess {
public:
    struct Options {
        /// Added to the environment, the directories' variables among them if they are to differ.
        std::vector<std::pair<std::string, std::string>> environment;
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
    void signal(int number) const;
    /// Waits for its end, at most some seconds; the exit status, or minus the signal, or nothing when it runs
    /// on.
    [[nodiscard]] std::optional<int> awaitEnd();
    /// SIGTERM, and the exit status.
    std::optional<int> stop();

    [[nodiscard]] pid_t pid() const noexcept { return pid_; }
    [[nodiscard]] const std::filesystem::path& directory() const noexcept { return directory_; }
    [[nodiscard]] std::string socketPath() const;
    [[nodiscard]] std::filesystem::path logs() const { return directory_ / "logs"; }
    [[nodiscard]] std::filesystem::path preferenceFile(std::string_view domain) const;
    /// What it wrote to standard error.
    [[nodiscard]] std::string errorOutput() const;
    /// Until the text stands in standard error, at most some seconds.
    [[nodiscard]] bool awaitErrorOutput(std::string_view text) const;
    /// The lines of the analytics sink, rotated files included, oldest first.
    [[nodiscard]] std::vector<std::string> events() const;
    [[nodiscard]] std::size_t countEvents(std::string_view text) const;

private:
    std::filesystem::path directory_;
    Options options_;
    pid_t pid_ = -1;
};

/// What a command of the shell wrote to its standard output, and its exit status.
struct CommandResult {
    std::string output;
    int status;
};
[[nodiscard]] CommandResult run(const std::string& command);

[[nodiscard]] sockaddr_un addressOf(const std::string& socketPath);
/// A socket of this type that is bound to the path.
[[nodiscard]] int boundSocket(int type, const std::string& path);
[[nodiscard]] std::string readFile(const std::filesystem::path& path);
void writeFile(const std::filesystem::path& path, std::string_view text);
/// Until the condition holds, at most some seconds.
[[nodiscard]] bool eventually(const std::function<bool()>& condition);

} // namespace tamblo::test
