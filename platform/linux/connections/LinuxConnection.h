#pragma once

#include "base/TextBuffer.h"
#include "os/FileDescriptor.h"
#include "platform/ConnectionService.h"
#include "platform/linux/loop/EventLoop.h"
#include "wire/Request.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <span>
#include <string>

namespace tamblo {

class LinuxConnectionService;

/// One client's socket: splits what arrives into frames, decodes each into a call of the exported object, and
/// sends the replies. Owned by the connection service until the connection has ended; replies that outlive
/// that keep the object, not the socket.
///
/// Reading, and everything with a handler, happens on the I/O thread. A reply may come from any thread; it is
/// held back until `releaseReplies`, which the service calls once what the request recorded is written out.
class LinuxConnection final : public ClientConnection,
                              public EventSource,
                              public std::enable_shared_from_this<LinuxConnection> {
public:
    LinuxConnection(LinuxConnectionService& service, FileDescriptor socket, pid_t peer);

    [[nodiscard]] pid_t peerProcessIdentifier() const noexcept override { return peer_; }
    void setExportedObject(std::shared_ptr<ZRReportingServiceProtocol> object) override;
    void setInterruptionHandler(UniqueFunction<void()> handler) override;
    void setInvalidationHandler(UniqueFunction<void()> handler) override;
    void resume() override;
    [[nodiscard]] std::string description() const override;

    void ready(std::uint32_t events) override;

    /// Appends the frame of a reply to those that are held back. From any thread.
    template <typename AppendFrame> void reply(const AppendFrame& appendFrame) {
        const std::lock_guard lock(mutex_);
        if (!isUnwritable_) {
            appendFrame(held_);
            replied();
        }
    }
    /// Lets go of the replies that are held back. From any thread.
    void releaseReplies();
    /// Requests that were handed on have been carried out.
    void workedOff(std::size_t requests, std::size_t bytes);
    /// Reads no more; for the service's shutdown.
    void stopReading();
    /// Ends the connection on the I/O thread: handlers first, then the socket.
    void end();

private:
    /// How the connection comes to its end; anything but an orderly one is an interruption first.
    enum class Ending : std::uint8_t { none, orderly, interrupted };

    void read();
    /// What has arrived, beginning with a frame; empty when there is none to begin with yet.
    [[nodiscard]] Ending receive(std::span<const std::uint8_t>& received);
    void takeFrames(std::span<const std::uint8_t> received);
    void keepRest(std::span<const std::uint8_t> rest, std::size_t wanted);
    void carryOut(std::span<const std::uint8_t> item);
    void refuse(const wire::Refusal& refusal);
    void beginEnd(Ending ending);
    // With the lock held.
    void replied();
    void sendLocked();
    void giveUpLocked();
    void watchLocked();

    LinuxConnectionService& service_;
    const pid_t peer_;
    std::shared_ptr<ZRReportingServiceProtocol> exportedObject_;
    UniqueFunction<void()> interruptionHandler_;
    UniqueFunction<void()> invalidationHandler_;

    // The I/O thread's.
    TextBuffer unfinished_; ///< the beginning of a frame
    std::size_t unfinishedWants_ = 0;
    Ending ending_ = Ending::none;

    std::atomic<std::size_t> waitingRequests_{0};
    std::atomic<std::size_t> waitingBytes_{0};

    std::mutex mutex_; ///< guards what follows
    FileDescriptor socket_;
    std::uint32_t watched_ = 0; ///< the epoll events asked for; 0: not in the loop
    bool wantsInput_ = false;
    bool isFlooded_ = false; ///< reading rests until what waits has been worked off
    bool isUnwritable_ = false;
    bool hasHeldReplies_ = false;
    TextBuffer held_;     ///< replies not yet to be seen
    TextBuffer outgoing_; ///< replies on their way
    std::size_t sent_ = 0;
};

} // namespace tamblo
