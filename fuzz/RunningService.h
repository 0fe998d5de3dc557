#pragma once

#include "Demand.h"
#include "platform/linux/LinuxPlatform.h"
#include "service/ZRReportingService.h"
#include "util/Context.h"
#include "wire/Protocol.h"

#include <cstdint>
#include <memory>
#include <thread>

#include <fcntl.h>
#include <sys/stat.h>

namespace tamblo::fuzz {

/// The whole service as `main` makes it, on threads of this process, in directories of its own, with its log
/// in a file. One for a process, from the first use to the process's end.
class RunningService {
public:
    static RunningService& get() {
        static auto* const service = new RunningService;
        return *service;
    }

    [[nodiscard]] std::string socketPath() const { return wire::socketPath(directory_.path("run")); }
    /// What all files of the sinks hold, and the log.
    [[nodiscard]] std::uint64_t bytesWritten() const {
        std::uint64_t sum = 0;
        for (const auto& file : std::filesystem::recursive_directory_iterator(directory_.path("logs"))) {
            std::error_code ignored;
            const auto size = file.is_regular_file(ignored) ? file.file_size(ignored) : 0;
            sum += ignored ? 0 : size;
        }
        return sum;
    }
    [[nodiscard]] std::uint64_t bytesLogged() const {
        struct stat status {};
        return ::fstat(STDERR_FILENO, &status) == 0 ? static_cast<std::uint64_t>(status.st_size) : 0;
    }
    /// What is on the disk.
    void remove() const {
        std::error_code ignored;
        std::filesystem::remove_all(directory_.path(), ignored);
    }
    /// Posts a notification, as another program would.
    void post(std::uint64_t state) const {
        directory_.write("run/notifications/com.vandra.dashlo.ringerstate", std::to_string(state));
    }
    /// Makes room, once much has been written.
    void clear() const {
        if (bytesWritten() > (32U << 20U)) {
            std::error_code ignored;
            for (const auto& file : std::filesystem::directory_iterator(directory_.path("logs"))) {
                std::filesystem::remove_all(file.path(), ignored);
            }
        }
        (void)!::ftruncate(STDERR_FILENO, 0);
    }

private:
    RunningService() {
        for (const auto& [variable, name] :
             {std::pair("RUNTIME_DIRECTORY", "run"), std::pair("CONFIGURATION_DIRECTORY", "config"),
              std::pair("LOGS_DIRECTORY", "logs")}) {
            ::setenv(variable, directory_.path(name).c_str(), 1);
        }
        // The fuzzer has taken its own to another descriptor.
        const int log = ::open(directory_.path("log").c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC,
                               S_IRUSR | S_IWUSR);
        demand(::dup2(log, STDERR_FILENO) == STDERR_FILENO);
        ::close(log);
        thread_ = std::thread([this] { run(); });
        while (!std::filesystem::exists(socketPath())) {
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        }
    }

    void run() {
        auto opened = LinuxPlatform::open();
        demand(opened.index() == 0);
        LinuxPlatform& linuxPlatform = *std::get<0>(opened);
        Context context(linuxPlatform.services());
        ZRReportingService service(context, [](int) {}); // lives on when a client wants it to end
        ConnectionListener& listener =
            context.platform().connections->listenerForServiceName(wire::kServiceName);
        listener.setDelegate(service);
        listener.resume();
        linuxPlatform.run(context.serverQueue(),
                          [&service](auto completion) { service.shutDown(std::move(completion)); });
    }

    const ScratchDirectory directory_;
    std::thread thread_; ///< never joined: this object never goes
};

} // namespace tamblo::fuzz
