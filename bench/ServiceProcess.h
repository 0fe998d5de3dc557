#pragma once

#include "TemporaryDirectory.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include <sys/types.h>

namespace tamblo::bench {

/// The real service as a child process, as it is shipped, with directories of its own and its log in a file.
/// The constructor returns once it accepts connections; the destructor ends it, by its own process
/// identifier, and it ends with this process too.
class ServiceProcess {
public:
    struct Settings {
        std::string program;
        int processor = 0;
        /// That the service's directories are made in; where scratch files usually are without one.
        std::string directory = {};
        /// The names of the analytics events in use, as a JSON array; all of them without it.
        std::optional<std::string> eventsInUse = std::nullopt;
        /// The call-quality back ends, as a JSON array; the usual one without it.
        std::optional<std::string> callQualityBackends = std::nullopt;
        /// What all sessions may retain, where the default is not enough for what is measured.
        std::optional<std::size_t> retainedBytes = std::nullopt;
        /// With everything on that an internal build can have, and some two hundred driver channels.
        bool isInternalBuild = false;
        bool hasDrivers = true; ///< of an internal build
        /// Whether other users may connect.
        bool isForOtherUsers = false;
        /// Called in the child before it becomes the service.
        std::function<void(const std::string& directory)> beforeExec = nullptr;
    };

    explicit ServiceProcess(const Settings& settings);
    ~ServiceProcess();
    ServiceProcess(const ServiceProcess&) = delete;
    ServiceProcess& operator=(const ServiceProcess&) = delete;

    [[nodiscard]] pid_t pid() const noexcept { return pid_; }
    [[nodiscard]] const std::string& socketPath() const noexcept { return socketPath_; }
    /// What it writes to standard error.
    [[nodiscard]] std::string logPath() const { return directory_.path() + "/log"; }
    /// Where its sinks' files are.
    [[nodiscard]] std::string logsDirectory() const { return directory_.path() + "/logs"; }
    /// How many lines of a sink's file hold the text, as far as the files that it keeps go back.
    [[nodiscard]] std::size_t countLines(std::string_view file, std::string_view text) const;
    /// How many analytics events of this name it has written, as far as the files that are kept go back.
    [[nodiscard]] std::size_t countEvents(std::string_view name) const;
    /// From just before the fork until the service had said that it is ready.
    [[nodiscard]] std::chrono::nanoseconds timeUntilReady() const noexcept { return timeUntilReady_; }
    /// From just before the fork until now.
    [[nodiscard]] std::chrono::nanoseconds age() const noexcept;

    /// Has the drivers of an internal build publish that each of their channels has gained something.
    void advanceDrivers();
    /// Until the service has worked off what its queues hold: an idle one uses no processor time at all.
    void awaitIdle() const;

    [[nodiscard]] bool isAlive() const noexcept;
    /// SIGTERM; how long it took to end, or nothing when it was killed in the end.
    std::optional<std::chrono::nanoseconds> terminate(std::chrono::seconds limit);
    /// SIGTERM, and throws when the service does not end by itself with status 0.
    void stop();

private:
    void start(const Settings& settings, const std::string& notifySocket);
    void waitUntilReady(int notifySocket);
    [[nodiscard]] std::string logTail() const;
    [[nodiscard]] bool awaitEnd(std::chrono::seconds limit, int& status);

    TemporaryDirectory directory_;
    std::string socketPath_;
    pid_t pid_ = -1;
    std::int64_t driversGain_ = 0;
    std::chrono::steady_clock::time_point startedAt_;
    std::chrono::nanoseconds timeUntilReady_{};
};

} // namespace tamblo::bench
