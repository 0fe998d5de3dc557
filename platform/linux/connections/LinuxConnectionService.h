#pragma once

#include "base/Mutex.h"
#include "os/FileDescriptor.h"
#include "platform/ConnectionService.h"
#include "platform/StructuredLog.h"
#include "platform/linux/connections/LinuxConnection.h"
#include "platform/linux/loop/EventLoop.h"

#include <memory>
#include <optional>
#include <string>
#include <unordered_set>
#include <vector>

#include <sys/stat.h>

namespace tamblo {

/// The interprocess connection service: a local stream socket in the runtime directory, or the one that the
/// process was started with. Listens, accepts, asks the delegate, and keeps the connections until they have
/// ended; accepting rests while the process has no descriptors left. On the I/O thread, unless said
/// otherwise.
class LinuxConnectionService final : public ConnectionService, public ConnectionListener, public EventSource {
public:
    /// Both must outlive the service.
    LinuxConnectionService(EventLoop& loop, StructuredLog& log) : shared_{loop, log, {}, {}} {}
    ~LinuxConnectionService() override;

    /// Takes over the socket of socket activation or binds one in the directory. A text says what is in the
    /// way.
    [[nodiscard]] std::optional<std::string> open(const std::string& runtimeDirectory);
    /// The queue that carries out requests, and its threads. Before the loop runs.
    void setRequestQueue(SerialQueue& queue, LinuxWorkQueues& threads) noexcept {
        shared_.intake.setQueue(queue, threads);
    }

    [[nodiscard]] ConnectionListener& listenerForServiceName(std::string_view serviceName) override;
    void setDelegate(ListenerDelegate& delegate) override { delegate_ = &delegate; }
    void resume() override;
    void ready(std::uint32_t events) override;

    /// The processes of the clients that are connected, each once. From any thread.
    [[nodiscard]] std::vector<pid_t> clientProcesses() TAMBLO_EXCLUDES(mutex_);
    /// Sends what was replied since the last call. From any thread.
    void releaseReplies() { shared_.heldReplies.release(); }
    /// Takes no further connections and reads no more from those there are; the socket file goes.
    void stop() TAMBLO_EXCLUDES(mutex_);
    /// Ends the connections, and with them what they export. Once the queues are at rest.
    void letGo() TAMBLO_EXCLUDES(mutex_);

private:
    [[nodiscard]] std::optional<std::string> adoptActivatedSocket();
    [[nodiscard]] std::optional<std::string> bindSocket(const std::string& path);
    void accept(FileDescriptor socket) TAMBLO_EXCLUDES(mutex_);
    void pauseAccepting(int error);
    void stopWatching();
    void removeSocketFile();

    LinuxConnection::Shared shared_;
    ListenerDelegate* delegate_ = nullptr;
    FileDescriptor socket_;
    std::string socketPath_; ///< empty with an activated socket
    struct stat socketFile_ {};
    bool isWatched_ = false;
    bool isPaused_ = false; ///< until a connection has been accepted

    Mutex mutex_;
    std::unordered_set<std::shared_ptr<LinuxConnection>> connections_ TAMBLO_GUARDED_BY(mutex_);
};

} // namespace tamblo
