#pragma once

#include "platform/Platform.h"
#include "platform/StatusSource.h"
#include "wire/Directories.h"

#include <functional>
#include <memory>
#include <string>
#include <variant>

namespace tamblo {

/// Everything that the service finds on Linux, made and wired once by `main`: the services behind the
/// platform's interfaces, the event loop that drives them, the signals that end it.
class LinuxPlatform {
public:
    /// Prepares the directories and opens the socket. A text says why the service cannot start and what to
    /// do.
    [[nodiscard]] static std::variant<std::unique_ptr<LinuxPlatform>, std::string> open();
    ~LinuxPlatform();
    LinuxPlatform(const LinuxPlatform&) = delete;
    LinuxPlatform& operator=(const LinuxPlatform&) = delete;

    /// The services behind the interfaces. They live as long as this does.
    [[nodiscard]] const Platform& services() const noexcept;

    /// Tells how the service is, on the status socket, from `run` on. The source outlives the platform's run.
    void showStatus(StatusSource& source, std::string version);

    /// Carries out requests until the first SIGTERM or SIGINT, then `shutDown`, and returns once that has
    /// called the completion that it is given, with the queues at rest and every connection gone. The server
    /// queue is written out and answered batch by batch: first what a batch recorded goes to the sinks'
    /// files, then its replies go to the clients.
    void run(SerialQueue& serverQueue, const std::function<void(std::function<void()> completion)>& shutDown);

private:
    class Signals;
    class Changes;
    struct Services;

    explicit LinuxPlatform(const wire::Directories& directories);

    std::unique_ptr<Services> services_;
};

} // namespace tamblo
