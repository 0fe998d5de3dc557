#pragma once

#include "base/TextBuffer.h"
#include "client/PendingReplies.h"
#include "client/SendQueue.h"
#include "os/FileDescriptor.h"

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <span>
#include <string>
#include <thread>
#include <utility>

struct iovec;

namespace tamblo::client {

enum class ConnectionState : std::uint8_t {
    connected,    ///< requests can be answered; the service knows nothing yet of sessions made before
    lost,         ///< a connection ended; what was sent and not answered has been answered with an error
    reconnecting, ///< attempts to connect are being made
};

using StateFunction = UniqueFunction<void(ConnectionState)>;

/// The client as a state machine: the socket, its reconnection, the requests under way. It has no thread;
/// whoever calls `pump` drives it, one thread at a time, and all callbacks run inside that call. Only
/// `outgoing`, `publish`, `abandon` and `wake` may be called from other threads.
///
/// Many queued frames leave with one system call and many replies are read with one. A frame that had not
/// left in full when a connection ended is sent again, from its start, over the next one.
class Engine {
public:
    struct Options {
        std::string socketPath;
        std::size_t queueCapacity = 1024;
        /// Without it the first loss, or failure to connect, answers everything that waits.
        bool reconnect = true;
        /// Whether others send while the pumping thread sleeps, so that it has to be woken.
        bool wakeable = false;
        StateFunction onState;
    };

    /// Waits between attempts to connect: doubled from the first to the longest. A message into an empty
    /// queue brings the next attempt forward, though not to less than the first wait after the last attempt.
    static constexpr std::chrono::milliseconds kFirstDelay{100};
    static constexpr std::chrono::milliseconds kLongestDelay{5000};

    explicit Engine(Options options);
    ~Engine();
    Engine(const Engine&) = delete;
    Engine& operator=(const Engine&) = delete;

    /// Where to write a request's frame; null when the queue is full. Either `publish` or `abandon` has to
    /// follow. Inside the callback that says `connected` the frame is one that goes ahead of all that waits
    /// in the queue.
    [[nodiscard]] OutgoingFrame* outgoing() noexcept;
    void publish(OutgoingFrame& frame) noexcept;
    void abandon(OutgoingFrame& frame) noexcept;

    /// Connects now if there is no connection.
    bool connect();
    [[nodiscard]] bool isConnected() const noexcept { return isConnected_.load(std::memory_order_relaxed); }
    /// Sends, receives and calls back, for at most this long; returns once a reply was handled, the
    /// connection changed or `wake` was called. The number of replies handled.
    std::size_t pump(std::chrono::milliseconds timeout);
    /// Has `pump` return, from any thread; only when wakeable.
    void wake() noexcept;
    /// The pumping thread: the connection's; -1 without one.
    [[nodiscard]] int descriptor() const noexcept { return socket_.get(); }
    /// The pumping thread: whether all that was queued has been handed to the kernel.
    [[nodiscard]] bool isFlushed() noexcept { return prologue_.empty() && queue_.empty(); }
    /// Ends the connection for good and answers everything that waits.
    void close();

    void countRefused() noexcept { refused_.fetch_add(1, std::memory_order_relaxed); }
    [[nodiscard]] std::uint64_t refused() const noexcept { return refused_.load(std::memory_order_relaxed); }
    [[nodiscard]] const std::string& socketPath() const noexcept { return options_.socketPath; }

private:
    using Clock = std::chrono::steady_clock;
    static constexpr std::size_t kFramesPerSend = 256;
    static constexpr std::size_t kReadBytes = 128 * 1024;

    [[nodiscard]] bool goesAhead() const noexcept {
        return announcingThread_.load(std::memory_order_relaxed) == std::this_thread::get_id();
    }
    [[nodiscard]] OutgoingFrame* frameAt(std::size_t index) noexcept;
    [[nodiscard]] bool open();
    [[nodiscard]] Clock::time_point nextAttempt(bool framesWait) const noexcept;
    void announce(ConnectionState state);
    void lose();
    void disconnect() noexcept;
    void failFrame(OutgoingFrame& frame, ErrorCode code);
    void failPrologue(ErrorCode code);
    /// Answers everything that waits to be sent.
    void failWaiting(ErrorCode code);

    void send();
    [[nodiscard]] bool sendPieces(std::span<iovec> pieces);
    [[nodiscard]] bool assignId(OutgoingFrame& frame);
    void dropSent(std::size_t bytes, std::size_t frames);

    [[nodiscard]] std::size_t waitAndReceive(Clock::time_point deadline);
    [[nodiscard]] std::size_t readReplies(int flags);
    [[nodiscard]] std::size_t handleReceived();
    [[nodiscard]] bool handleReply(std::span<const std::uint8_t> item);
    [[nodiscard]] bool setReceiveTimeout(std::chrono::milliseconds timeout) noexcept;
    /// Sleeps until then, or until there is something to read, room to send, or, if asked for, a frame to
    /// send. Whether there is something to read.
    [[nodiscard]] bool sleepUntil(Clock::time_point time, bool framesWake);
    /// Has senders wake this thread from now on; false when a frame has come already.
    [[nodiscard]] bool mayFallAsleep() noexcept;
    void writeWakeUp() noexcept;

    Options options_;
    SendQueue queue_;
    /// Frames written inside the callback that says `connected`.
    std::deque<OutgoingFrame> prologue_;
    PendingReplies pending_;
    TextBuffer received_;

    FileDescriptor socket_;
    FileDescriptor wakeUp_; ///< an eventfd, when wakeable
    bool isPumping_ = false;
    bool isAnnouncing_ = false;
    /// Something happened that a caller of `pump` may wait for, other than a reply.
    bool hasNews_ = false;
    bool announcedReconnecting_ = false;
    bool socketIsFull_ = false;
    /// Whether frames waited at the last attempt to connect.
    bool hadWaiting_ = false;
    std::size_t sentOfFirst_ = 0; ///< bytes of the first frame that have left
    std::size_t wantedBytes_ = 0; ///< of a reply that has arrived in part
    std::chrono::milliseconds receiveTimeout_{0};
    std::chrono::milliseconds delay_{0};
    Clock::time_point lastAttempt_{};

    /// The pumping thread while it says `connected`: what that thread sends then goes ahead.
    std::atomic<std::thread::id> announcingThread_{};
    std::atomic<bool> isClosed_{false};
    std::atomic<bool> isWakeWanted_{false};
    std::atomic<bool> isConnected_{false};
    std::atomic<bool> isAsleep_{false};
    std::atomic<std::uint64_t> refused_{0};
};

/// A claimed place for a frame, given up unless it is published: whatever happens in between, the queue goes
/// on.
class ClaimedFrame {
public:
    explicit ClaimedFrame(Engine& engine) noexcept : engine_(engine), frame_(engine.outgoing()) {}
    ClaimedFrame(const ClaimedFrame&) = delete;
    ClaimedFrame& operator=(const ClaimedFrame&) = delete;
    ~ClaimedFrame() {
        if (frame_ != nullptr) {
            engine_.abandon(*frame_);
        }
    }

    explicit operator bool() const noexcept { return frame_ != nullptr; }
    OutgoingFrame* operator->() noexcept { return frame_; }
    void publish() noexcept { engine_.publish(*std::exchange(frame_, nullptr)); }

private:
    Engine& engine_;
    OutgoingFrame* frame_;
};

} // namespace tamblo::client
