#pragma once

#include "base/Mutex.h"
#include "os/FileDescriptor.h"
#include "platform/Clock.h"
#include "platform/ConnectionService.h"
#include "platform/Limits.h"
#include "platform/StructuredLog.h"
#include "platform/linux/connections/LinuxConnection.h"
#include "platform/linux/connections/ListeningSocket.h"
#include "platform/linux/loop/EventLoop.h"

#include <cstddef>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <unordered_set>
#include <vector>

namespace tamblo {

/// What the connections of one user have together, at most; by the names of the limits.
struct ConnectionUse {
    std::size_t connections = 0;
    std::size_t waitingBytes = 0;
    std::size_t unfinishedBytes = 0;
    std::size_t replyBytes = 0;
};

/// The interprocess connection service: a local stream socket in the runtime directory, or the one that the
/// process was started with. Listens, accepts, asks the delegate, and keeps the connections until they have
/// ended. A user may have so many; and the last descriptors that the process may have are nobody's
/// connections, so that sinks and settings can always be opened. Accepting rests while the system has none
/// left. On the I/O thread, unless said otherwise.
class LinuxConnectionService final : public ConnectionService, public ConnectionListener, public EventSource {
public:
    /// All must outlive the service.
    LinuxConnectionService(EventLoop& loop, const Clock& clock, StructuredLog& log, const Limits& limits);

    /// Takes over the socket of socket activation or binds one in the directory. A text says what is in the
    /// way.
    [[nodiscard]] std::optional<std::string> open(const std::string& runtimeDirectory);
    /// The queue that carries out requests, and its threads. Before the loop runs.
    void setServerQueue(SerialQueue& queue, LinuxWorkQueues& threads) {
        shared_.turns.emplace(queue, clock_);
        shared_.intake.setServerQueue(queue, threads);
    }
    /// Reads connections that have something to read; whether some are left. Once in a wake-up.
    [[nodiscard]] bool readSome() { return shared_.reading.readSome(); }

    [[nodiscard]] ConnectionListener& listenerForServiceName(std::string_view serviceName) override;
    void setDelegate(ListenerDelegate& delegate) override { delegate_ = &delegate; }
    void resume() override;
    void ready(std::uint32_t events) override;

    /// The processes of the clients that are connected, each once. From any thread.
    [[nodiscard]] std::vector<pid_t> clientProcesses() TAMBLO_EXCLUDES(mutex_);
    /// Of each limit of a user, what the user has who has most of it. On the I/O thread.
    [[nodiscard]] ConnectionUse use() const;
    /// From any thread.
    [[nodiscard]] std::size_t connectionCount() TAMBLO_EXCLUDES(mutex_);
    /// Sends what was replied since the last call. From any thread.
    void releaseReplies() { shared_.heldReplies.release(); }
    /// Takes no further connections and reads no more from those there are; the socket file goes.
    void stop() TAMBLO_EXCLUDES(mutex_);
    /// Ends the connections, and with them what they export. Once the queues are at rest.
    void letGo() TAMBLO_EXCLUDES(mutex_);

private:
    void accept(FileDescriptor socket) TAMBLO_EXCLUDES(mutex_);
    [[nodiscard]] const std::shared_ptr<ClientUser>& userNumbered(uid_t user);
    void ended(const std::shared_ptr<LinuxConnection>& connection, ClientUser& user) TAMBLO_EXCLUDES(mutex_);
    /// Why a user may have no further connection, if so.
    [[nodiscard]] std::optional<ReplyError> refusalOf(const ClientUser& user, int descriptor) const;
    void pauseAccepting(int error);
    void stopWatching();

    LinuxConnection::Shared shared_;
    const Clock& clock_;
    /// How many descriptors the process may have.
    const std::size_t descriptors_;
    std::map<uid_t, std::shared_ptr<ClientUser>> users_; ///< those with connections
    ListenerDelegate* delegate_ = nullptr;
    ListeningSocket socket_;
    bool isWatched_ = false;
    bool isPaused_ = false; ///< until a connection has been accepted

    Mutex mutex_;
    std::unordered_set<std::shared_ptr<LinuxConnection>> connections_ TAMBLO_GUARDED_BY(mutex_);
};

} // namespace tamblo
