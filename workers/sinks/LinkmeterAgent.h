#pragma once

#include "base/Mutex.h"
#include "platform/CallQualityService.h"
#include "platform/ZRReportingServiceProtocol.h"
#include "session/ZRReportingSessionMessage.h"
#include "util/AudioEvents.h"
#include "util/Context.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// What of one session is done on the call-quality worker's own queue: setting up, sending, stopping. Setting
/// up waits, at most nine seconds, until the service has found its back ends. No thread does: the queue is
/// suspended, and the completion, or a delayed call, has it go on.
///
/// A message that finds the queue idle, as nearly all do, is sent by whoever hands it in, where the service
/// can take it without waiting: nothing could come before it, and it need not be copied.
///
/// What is posted holds the agent, and runs after the worker has gone; the agent of a session that was
/// dropped without a stop waits for nothing, and what is left to do for it is nothing.
class LinkmeterAgent : public std::enable_shared_from_this<LinkmeterAgent> {
public:
    struct Message {
        Dictionary payload;
        AudioEventCategory category;
        AudioEventType type;
    };

    /// Payloads of all sessions that wait: until back ends are found, or for a slow disk. What comes beyond
    /// is lost, which one error line for each run of a session tells.
    static constexpr std::size_t kMostWaitingBytes = 16U << 20U;

    explicit LinkmeterAgent(Context& context);
    LinkmeterAgent(const LinkmeterAgent&) = delete;
    LinkmeterAgent& operator=(const LinkmeterAgent&) = delete;

    // None blocks. One thread at a time.
    /// With what the service is told of the session.
    void start(Dictionary sessionInfo, Dictionary userInfo);
    void send(const Dictionary& payload, AudioEventCategory category, AudioEventType type);
    /// With the payloads that are summed up; nothing for a session without messages.
    void stop(std::optional<std::vector<Dictionary>> payloads, AudioServiceType serviceType,
              ReporterID reporterID);
    /// The worker goes.
    void abandon();

private:
    struct WaitingBytes;
    class CountedPiece;
    /// What one piece of work sends.
    struct Messages {
        explicit Messages(WaitingBytes& waiting) : all(waiting) {}
        ~Messages();
        Messages(const Messages&) = delete;
        Messages& operator=(const Messages&) = delete;

        std::vector<Message> list; ///< not sent yet; what is left in the end is lost
        std::size_t bytes = 0;     ///< that count as waiting
        WaitingBytes& all;
    };

    /// Holds a message until those before it are done.
    void queue(Message message);
    /// Whether there is room for one more that has to wait.
    [[nodiscard]] bool addWaiting(Messages& messages, const Message& message) TAMBLO_REQUIRES(mutex_);

    template <typename Piece> void post(Piece piece, Pace pace = Pace::quick);

    // Any thread.
    void backendsFound(const std::optional<std::vector<std::string>>& backends);
    void timeOut(std::uint64_t waitNumber);
    void tellWhatWasFound() const;

    // While the queue is idle.
    /// Answers whether that could be done.
    [[nodiscard]] bool sendAtOnce(const Dictionary& payload, AudioEventCategory category,
                                  AudioEventType type);

    [[nodiscard]] std::string_view keyLeftOut() const noexcept;
    static void logSending();
    void logSent(const Dictionary& payload, AudioEventCategory category, AudioEventType type) const;

    // On the queue.
    void setUp(Dictionary sessionInfo, const Dictionary& userInfo);
    void waitForBackends();
    void sendAll(const std::shared_ptr<Messages>& messages);
    void sendMessage(const Dictionary& payload, AudioEventCategory category, AudioEventType type);
    void finish(std::optional<std::vector<Dictionary>> payloads, AudioServiceType serviceType,
                ReporterID reporterID);
    void sendSummary(std::vector<Dictionary> payloads, AudioServiceType serviceType, ReporterID reporterID);

    const Context& context_;
    WaitingBytes& waiting_;
    std::unique_ptr<SerialQueue> linkmeterQueue_; ///< made by the first post
    std::atomic<bool> linkmeterSessionStarted_{false};
    std::atomic<bool> isDropped_{false}; ///< nobody will hear of the session any more

    /// Touched on the queue, while it is idle, or by what ends its wait.
    CallQualityService::SessionRef linkmeterSession_;

    std::atomic<std::size_t> posted_{0}; ///< pieces that are not over
    /// The wait of the latest run is over; set behind all else that ends it.
    std::atomic<bool> isSetUp_{false};

    Mutex mutex_;
    bool isAbandoned_ TAMBLO_GUARDED_BY(mutex_) = false;
    std::size_t stopsToCome_ TAMBLO_GUARDED_BY(mutex_) = 0;
    bool isWaiting_ TAMBLO_GUARDED_BY(mutex_) = false;
    bool isFullTold_ TAMBLO_GUARDED_BY(mutex_) = false;
    std::uint64_t waitNumber_ TAMBLO_GUARDED_BY(mutex_) = 0;
    std::unique_ptr<DelayedCall> timeOut_ TAMBLO_GUARDED_BY(mutex_);
    /// What the piece that was posted last will send, until it begins: of messages that many may wait, for
    /// nine seconds, and so they share a piece.
    std::shared_ptr<Messages> toSend_ TAMBLO_GUARDED_BY(mutex_);
    /// The count of the semaphore that the wait is for. It lasts: back ends that come too late for one run
    /// of the session are there at once for the next.
    unsigned signals_ TAMBLO_GUARDED_BY(mutex_) = 0;
};

} // namespace tamblo
