#pragma once

#include "base/Cbor.h"
#include "os/FileDescriptor.h"
#include "platform/ConnectionService.h"
#include "platform/StructuredLog.h"
#include "platform/WorkQueue.h"
#include "platform/linux/connections/LinuxConnection.h"
#include "platform/linux/loop/EventLoop.h"

#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include <sys/stat.h>

namespace tamblo {

// Whom the service trusts. Whoever may open the socket may report; who that is, is the business of the
// directory that it lies in. Nothing a client sends is believed: not its identity (the kernel reports the
// peer's process), not a length, a count or a name. One client can cost the others at most the limits below,
// and its own connection.

/// Reading a connection rests while more than this of it waits to be carried out: a fast client is slowed.
inline constexpr std::size_t kMaximumWaitingRequests = 1024;
inline constexpr std::size_t kMaximumWaitingBytes = 4 * 1024 * 1024;
/// A client that does not read is closed once this many bytes of replies wait for it.
inline constexpr std::size_t kMaximumWaitingReplies = 4 * 1024 * 1024;
/// What one read takes at most: some hundred messages, so that a batch costs few system calls and no
/// connection holds up the others for long.
inline constexpr std::size_t kBytesPerRead = 128 * 1024;
/// An unfinished frame up to this size is put in front of the next read; a longer one is collected where it
/// is.
inline constexpr std::size_t kSmallRest = 16 * 1024;
/// Requests read in one wake-up are carried out in batches of about this many.
inline constexpr std::size_t kRequestsPerBatch = 256;

/// The interprocess connection service: a local stream socket in the runtime directory, or the one that the
/// process was started with. Everything but the replies happens on the I/O thread.
class LinuxConnectionService final : public ConnectionService, public ConnectionListener, public EventSource {
public:
    LinuxConnectionService(EventLoop& loop, StructuredLog& log);
    ~LinuxConnectionService() override;

    /// Takes over the socket of socket activation or binds one in the directory. A text says what is in the
    /// way.
    [[nodiscard]] std::optional<std::string> open(const std::string& runtimeDirectory);
    /// The queue that carries out requests: connections follow what it has worked off.
    void setRequestQueue(SerialQueue& queue) noexcept { requests_ = &queue; }

    [[nodiscard]] ConnectionListener& listenerForServiceName(std::string_view serviceName) override;
    void setDelegate(ListenerDelegate& delegate) override { delegate_ = &delegate; }
    void resume() override;
    void ready(std::uint32_t events) override;

    /// The processes of the clients that are connected, each once. From any thread.
    [[nodiscard]] std::vector<pid_t> clientProcesses();
    /// Sends what was replied since the last call. From any thread.
    void releaseReplies();
    /// Takes no further connections and reads no more from those there are; the socket file goes.
    void stop();

private:
    friend class LinuxConnection;

    [[nodiscard]] std::optional<std::string> adoptActivatedSocket();
    [[nodiscard]] std::optional<std::string> bindSocket(const std::string& path);
    void accept(FileDescriptor socket);
    void pauseAccepting(int error);
    void removeSocketFile();
    void hasReplies(std::shared_ptr<LinuxConnection> connection);
    void posted(std::size_t requests);
    void ended(LinuxConnection& connection);

    EventLoop& loop_;
    StructuredLog& log_;
    ListenerDelegate* delegate_ = nullptr;
    SerialQueue* requests_ = nullptr;
    FileDescriptor socket_;
    std::string socketPath_; ///< empty with an activated socket
    struct stat socketFile_ {};
    bool isPaused_ = false;
    std::unordered_map<LinuxConnection*, std::shared_ptr<LinuxConnection>> connections_;

    // For the connections' reading, one at a time.
    std::unique_ptr<std::uint8_t[]> readBuffer_;
    KeySetCache keySets_;
    wire::Request request_;

    std::mutex mutex_; ///< guards what follows
    std::vector<std::shared_ptr<LinuxConnection>> replied_;
    std::map<pid_t, std::size_t> connectionsByProcess_;
};

} // namespace tamblo
