#pragma once

#include "base/Mutex.h"
#include "base/TextBuffer.h"
#include "os/FileDescriptor.h"
#include "platform/ConnectionService.h"
#include "platform/StructuredLog.h"
#include "platform/linux/connections/HeldReplies.h"
#include "platform/linux/connections/RequestIntake.h"
#include "platform/linux/loop/EventLoop.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <utility>

namespace tamblo {

// Whom the service trusts. Whoever may open the socket may report; who that is, is the business of the
// directory that it lies in. Nothing a client sends is believed: not its identity (the kernel reports the
// peer's process), not a length, a count or a name. One client can cost the others at most the limits below,
// and its own connection.

/// Reading a connection rests while more than this of it waits to be carried out: a fast client is slowed.
inline constexpr std::size_t kMaximumWaitingRequests = 1024;
inline constexpr std::size_t kMaximumWaitingBytes = 4 * 1024 * 1024;
/// A client is closed once this many bytes of replies wait for their sinks, or for it to read them.
inline constexpr std::size_t kMaximumWaitingReplies = 4 * 1024 * 1024;

/// One client's socket: splits what arrives into frames, decodes each into a call of the exported object, and
/// sends the replies.
///
/// Reading, and everything with a handler, happens on the I/O thread; one read for each wake-up, so that
/// connections take turns. The bytes go through the buffer that all connections share; only the beginning of
/// an unfinished frame is kept here. A frame that is no request is refused at once and not held back, as
/// nothing is recorded for it.
///
/// A reply may come from any thread, under the lock. It is kept until the sinks are written (`HeldReplies`),
/// then sent as far as the socket takes it; the loop tells when it takes more. Sending never waits.
///
/// A client can be faster than the service in two ways. Of one that sends too fast, no more is read until
/// what waits has been carried out, so the kernel holds it back. One whose replies grow beyond their limit,
/// in one batch or because it does not read them, cannot be held back: its connection ends. It ends, too,
/// when the peer hangs up or breaks the protocol, and when the kernel refuses to watch the socket.
///
/// An end takes its turn: what was read before is carried out and answered first. Then the handlers are
/// called and the object is let go, last the socket: a client that sees the end of its connection is one that
/// the service has let go of. Owned by the connection service until that has happened; replies that come
/// later keep the object, not the socket.
class LinuxConnection final : public ClientConnection,
                              public EventSource,
                              public std::enable_shared_from_this<LinuxConnection> {
public:
    /// What all connections use; outlives them.
    struct Shared {
        EventLoop& loop;
        StructuredLog& log;
        RequestIntake intake;
        HeldReplies heldReplies;
    };
    /// Called once, on the I/O thread, when nothing is left to do for the connection.
    using Ended = UniqueFunction<void(const std::shared_ptr<LinuxConnection>&)>;

    LinuxConnection(Shared& shared, FileDescriptor socket, pid_t peer, Ended ended);

    [[nodiscard]] pid_t peerProcessIdentifier() const noexcept override { return peer_; }
    void setExportedObject(std::shared_ptr<ZRReportingServiceProtocol> object) override {
        exportedObject_ = std::move(object);
    }
    void setInterruptionHandler(UniqueFunction<void()> handler) override {
        interruptionHandler_ = std::move(handler);
    }
    void setInvalidationHandler(UniqueFunction<void()> handler) override {
        invalidationHandler_ = std::move(handler);
    }
    void resume() override TAMBLO_EXCLUDES(mutex_);
    [[nodiscard]] std::string description() const override;

    void ready(std::uint32_t events) override TAMBLO_EXCLUDES(mutex_);

    /// Appends the frame of a reply to those that are held back. From any thread.
    template <typename AppendFrame> void reply(const AppendFrame& appendFrame) TAMBLO_EXCLUDES(mutex_) {
        const MutexLock lock(mutex_);
        if (!isUnwritable_) {
            appendFrame(held_);
            replied();
        }
    }
    /// Sends the replies that are held back. From any thread.
    void releaseReplies() TAMBLO_EXCLUDES(mutex_);
    /// Reads no more; for the service's shutdown.
    void stopReading() TAMBLO_EXCLUDES(mutex_);

private:
    /// How the connection comes to its end; anything but an orderly one is an interruption first.
    enum class Ending : std::uint8_t { none, orderly, interrupted };

    /// What has arrived, beginning with a frame; empty when there is none to begin with yet.
    [[nodiscard]] Ending receive(int socket, std::span<const std::uint8_t>& received);
    void takeFrames(std::span<const std::uint8_t> received) TAMBLO_EXCLUDES(mutex_);
    void keepRest(std::span<const std::uint8_t> rest, std::size_t wanted);
    void decodeAndDispatch(std::span<const std::uint8_t> item) TAMBLO_EXCLUDES(mutex_);
    void refuse(const wire::Refusal& refusal) TAMBLO_EXCLUDES(mutex_);
    void carriedOut(std::size_t requests, std::size_t bytes) TAMBLO_EXCLUDES(mutex_);
    void beginEnd(Ending ending) TAMBLO_EXCLUDES(mutex_);
    void end() TAMBLO_EXCLUDES(mutex_);
    void replied() TAMBLO_REQUIRES(mutex_);
    void send() TAMBLO_REQUIRES(mutex_);
    void giveUp() TAMBLO_REQUIRES(mutex_);
    void watch() TAMBLO_REQUIRES(mutex_);

    Shared& shared_;
    const pid_t peer_;

    // The I/O thread's.
    Ended ended_;
    std::shared_ptr<ZRReportingServiceProtocol> exportedObject_;
    UniqueFunction<void()> interruptionHandler_;
    UniqueFunction<void()> invalidationHandler_;
    TextBuffer unfinished_; ///< the beginning of a frame
    std::size_t unfinishedWants_ = 0;
    Ending ending_ = Ending::none;

    std::atomic<std::size_t> waitingRequests_{0};
    std::atomic<std::size_t> waitingBytes_{0};

    Mutex mutex_;
    FileDescriptor socket_ TAMBLO_GUARDED_BY(mutex_);     ///< closed by the I/O thread
    std::uint32_t watched_ TAMBLO_GUARDED_BY(mutex_) = 0; ///< the events asked for; 0: not in the loop
    bool wantsInput_ TAMBLO_GUARDED_BY(mutex_) = false;
    bool isFlooded_ TAMBLO_GUARDED_BY(mutex_) = false; ///< until what waits has been carried out
    bool isUnwritable_ TAMBLO_GUARDED_BY(mutex_) = false;
    bool hasHeldReplies_ TAMBLO_GUARDED_BY(mutex_) = false;
    TextBuffer held_ TAMBLO_GUARDED_BY(mutex_);     ///< replies not yet to be seen
    TextBuffer outgoing_ TAMBLO_GUARDED_BY(mutex_); ///< replies on their way
    std::size_t sent_ TAMBLO_GUARDED_BY(mutex_) = 0;
};

} // namespace tamblo
