#pragma once

#include "base/Mutex.h"
#include "base/TextBuffer.h"
#include "base/UniqueFunction.h"
#include "os/FileDescriptor.h"
#include "platform/ConnectionService.h"
#include "platform/Limits.h"
#include "platform/RequestTurns.h"
#include "platform/StructuredLog.h"
#include "platform/linux/connections/ClientUser.h"
#include "platform/linux/connections/HeldReplies.h"
#include "platform/linux/connections/ReadTurns.h"
#include "platform/linux/connections/RequestIntake.h"
#include "platform/linux/connections/UnfinishedFrames.h"
#include "platform/linux/loop/EventLoop.h"

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace tamblo {

// Whom the service trusts. Whoever may open the socket may report; who that is, is the business of the
// directory that it lies in, and of the socket's mode. Nothing a client sends is believed: not its identity
// (the kernel reports the peer's user and process), not a length, a count or a name. What it may ask for is
// limited (`Limits`), each limit in one place: those of a frame where it is decoded, those of what waits
// here, those of sessions and what they hold where these are kept. Within the limits, users and their
// connections take turns by time (`ReadTurns`, `RequestTurns`). So one client can cost the others a slice of
// time, and its own connection.

/// One client's socket: splits what arrives into frames, decodes each into a call of the exported object, and
/// sends the replies.
///
/// Reading, and everything with a handler, happens on the I/O thread; one read for each turn. The bytes go
/// through the buffer that all connections share; only the beginning of an unfinished frame is kept here. A
/// frame that is no request, or beyond a limit, is refused at once and not held back, as nothing is recorded
/// for it.
///
/// A reply may come from any thread, under the lock. It is kept until the sinks are written (`HeldReplies`),
/// then sent as far as the socket takes it; the loop tells when it takes more. Sending never waits.
///
/// A client can be faster than the service in two ways. Of one that sends too fast, no more is read until
/// what waits has been carried out, so the kernel holds it back; likewise of all connections of a user. One
/// that asks for more than it reads has its requests held back for a moment; when it does not read on, its
/// replies grow to their limit, and its connection ends. It ends, too, when the peer hangs up or breaks the
/// protocol, when a frame that has begun gets no further, when there is no memory for it, and when the kernel
/// refuses to watch the socket.
///
/// An end takes its turn: what was read before is carried out and answered first, as far as the peer takes
/// it. Then the handlers are called and the object is let go, last the socket: a client that sees the end of
/// its connection is one that the service has let go of. Owned by the connection service until that has
/// happened; replies that come later keep the object, not the socket.
class LinuxConnection final : public ClientConnection,
                              public EventSource,
                              public std::enable_shared_from_this<LinuxConnection> {
public:
    /// What all connections use; outlives them.
    struct Shared {
        Shared(EventLoop& eventLoop, StructuredLog& lines, const Limits& allowed)
            : loop(eventLoop),
              log(lines),
              limits(allowed),
              intake(allowed),
              unfinished(eventLoop, std::chrono::seconds(allowed.frameSeconds)) {}

        EventLoop& loop;
        StructuredLog& log;
        const Limits& limits;
        RequestIntake intake;
        HeldReplies heldReplies;
        ReadTurns reading;
        UnfinishedFrames unfinished;
        std::optional<RequestTurns> turns; ///< before the first connection
    };
    struct Peer {
        ClientIdentity identity;
        FileDescriptor process; ///< a handle of it, where the kernel gives one
    };
    /// Called once, on the I/O thread, when nothing is left to do for the connection.
    using Ended = UniqueFunction<void(const std::shared_ptr<LinuxConnection>&)>;

    LinuxConnection(Shared& shared, FileDescriptor socket, Peer peer, std::shared_ptr<ClientUser> user,
                    Ended ended);
    /// Makes the queue of its requests; the first thing after the constructor.
    void openQueue();

    [[nodiscard]] ClientIdentity peer() const noexcept override { return peer_; }
    [[nodiscard]] bool isPeerThere() const noexcept override;
    [[nodiscard]] const std::shared_ptr<RequestQueue>& requestQueue() const noexcept override {
        return requests_;
    }
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
    /// Its turn to be read, at this time.
    void read(RequestTally::Time now) TAMBLO_EXCLUDES(mutex_);
    /// What that took of the processor.
    void noteReading(std::chrono::nanoseconds time) noexcept { requests_->tally().addReadingTime(time); }
    /// A frame that has begun got no further.
    void endUnfinished() TAMBLO_EXCLUDES(mutex_);
    /// Refuses the connection as a whole, which is not resumed: the reason is sent.
    void turnAway(const ReplyError& reason) TAMBLO_EXCLUDES(mutex_);

    /// Appends the frame of a reply to those that are held back. From any thread.
    template <typename AppendFrame> void reply(const AppendFrame& appendFrame) TAMBLO_EXCLUDES(mutex_) {
        const MutexLock lock(mutex_);
        if (!isUnwritable_) {
            appendFrame(held_);
            replied();
        }
    }
    /// Tells the log, once, that the client has reached a limit. From any thread.
    void noteLimit(std::string_view limit);
    /// Sends the replies that are held back. From any thread.
    void releaseReplies() TAMBLO_EXCLUDES(mutex_);
    /// Reads no more; for the service's shutdown.
    void stopReading() TAMBLO_EXCLUDES(mutex_);

private:
    /// Buffers above this are given back once they are empty.
    static constexpr std::size_t kKeptCapacity = 64 * 1024;
    /// A peer that takes nothing for so long does not read.
    static constexpr std::chrono::seconds kPatienceWithPeer{1};

    /// How the connection comes to its end; anything but an orderly one is an interruption first.
    enum class Ending : std::uint8_t { none, orderly, interrupted };

    void readOnce() TAMBLO_EXCLUDES(mutex_);
    /// What has arrived, beginning with a frame; empty when there is none to begin with yet.
    [[nodiscard]] Ending receive(int socket, std::span<const std::uint8_t>& received);
    void takeFrames(std::span<const std::uint8_t> received) TAMBLO_EXCLUDES(mutex_);
    void keepRest(std::span<const std::uint8_t> rest, std::size_t wanted);
    void countUnfinished() TAMBLO_EXCLUDES(mutex_);
    /// Answers the bytes that the decoded request takes while it waits; 0 for a refused one.
    [[nodiscard]] std::size_t decodeAndDispatch(std::span<const std::uint8_t> item) TAMBLO_EXCLUDES(mutex_);
    /// Adds an error to what `sendRefusals` sends.
    void addError(std::uint64_t id, const ReplyError& error) TAMBLO_EXCLUDES(mutex_);
    /// The same for a request, and notes and ends what the refusal asks for.
    void refuse(const wire::Refusal& refusal) TAMBLO_EXCLUDES(mutex_);
    void refuseKill(std::uint64_t id) TAMBLO_EXCLUDES(mutex_);
    void sendRefusals() TAMBLO_EXCLUDES(mutex_);
    /// Ends the connection with an error frame that names the limit.
    void endBeyond(const ReplyError& limit) TAMBLO_EXCLUDES(mutex_);
    [[nodiscard]] bool holdBackIfFlooded() TAMBLO_EXCLUDES(mutex_);
    void carriedOut(std::size_t requests, std::size_t bytes) TAMBLO_EXCLUDES(mutex_);
    void readOn() TAMBLO_EXCLUDES(mutex_);
    void readOnOthers() TAMBLO_EXCLUDES(mutex_);
    void beginEnd(Ending ending) TAMBLO_EXCLUDES(mutex_);
    void end() TAMBLO_EXCLUDES(mutex_);
    [[nodiscard]] bool beginWaitForPeer() TAMBLO_EXCLUDES(mutex_);
    void watch() TAMBLO_REQUIRES(mutex_);

    // Replies, and peers that do not read them: `ConnectionReplies.cpp`.
    void replied() TAMBLO_REQUIRES(mutex_);
    void send() TAMBLO_REQUIRES(mutex_);
    [[nodiscard]] std::size_t unsent() const TAMBLO_REQUIRES(mutex_) { return outgoing_.size() - sent_; }
    void countUnsent() TAMBLO_REQUIRES(mutex_);
    void holdRequests() TAMBLO_REQUIRES(mutex_);
    void letRequestsGo() TAMBLO_REQUIRES(mutex_);
    void awaitPeerReads() TAMBLO_EXCLUDES(mutex_);
    void lookWhetherPeerReads(std::int64_t readBefore) TAMBLO_EXCLUDES(mutex_);
    [[nodiscard]] std::int64_t readByPeer() const TAMBLO_REQUIRES(mutex_);
    void noteSilent() TAMBLO_REQUIRES(mutex_);
    void endSilentOfUser() TAMBLO_REQUIRES(mutex_);
    void endIfSilent() TAMBLO_EXCLUDES(mutex_);
    void giveUp() TAMBLO_REQUIRES(mutex_);

    Shared& shared_;
    const ClientIdentity peer_;
    const std::shared_ptr<ClientUser> user_;
    std::shared_ptr<RequestQueue> requests_;

    // The I/O thread's.
    FileDescriptor peerProcess_; ///< until the connection is accepted
    Ended ended_;
    std::shared_ptr<ZRReportingServiceProtocol> exportedObject_;
    UniqueFunction<void()> interruptionHandler_;
    UniqueFunction<void()> invalidationHandler_;
    TextBuffer unfinished_; ///< the beginning of a frame
    std::size_t unfinishedWants_ = 0;
    std::size_t unfinishedCounted_ = 0; ///< with the user
    UnfinishedFrames::Place unfinishedPlace_;
    Ending ending_ = Ending::none;
    bool isReadable_ = false;  ///< listed for its turn
    bool isKillNoted_ = false; ///< in the log

    std::atomic<bool> isLimitNoted_{false};
    std::atomic<std::size_t> waitingRequests_{0};
    std::atomic<std::size_t> waitingBytes_{0};

    Mutex mutex_;
    FileDescriptor socket_ TAMBLO_GUARDED_BY(mutex_);     ///< closed by the I/O thread
    std::uint32_t watched_ TAMBLO_GUARDED_BY(mutex_) = 0; ///< the events asked for; 0: not in the loop
    bool wantsInput_ TAMBLO_GUARDED_BY(mutex_) = false;
    bool isFlooded_ TAMBLO_GUARDED_BY(mutex_) = false; ///< until what waits has been carried out
    bool isUnwritable_ TAMBLO_GUARDED_BY(mutex_) = false;
    bool hasHeldReplies_ TAMBLO_GUARDED_BY(mutex_) = false;
    bool hasRefusals_ TAMBLO_GUARDED_BY(mutex_) = false; ///< that are still to be sent
    TextBuffer held_ TAMBLO_GUARDED_BY(mutex_);          ///< replies not yet to be seen
    TextBuffer outgoing_ TAMBLO_GUARDED_BY(mutex_);      ///< replies on their way
    std::size_t sent_ TAMBLO_GUARDED_BY(mutex_) = 0;
    std::size_t unsentCounted_ TAMBLO_GUARDED_BY(mutex_) = 0; ///< with the user
    std::uint64_t taken_ TAMBLO_GUARDED_BY(mutex_) = 0;       ///< bytes, by the socket, ever
    bool areRequestsHeld_ TAMBLO_GUARDED_BY(mutex_) = false;
    bool isNotedSilent_ TAMBLO_GUARDED_BY(mutex_) = false;    ///< with the user
    bool isPatienceOver_ TAMBLO_GUARDED_BY(mutex_) = false;   ///< with a peer that did not read
    bool isWaitingForPeer_ TAMBLO_GUARDED_BY(mutex_) = false; ///< at its end, to take what is left
};

} // namespace tamblo
