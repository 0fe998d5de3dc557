#pragma once

#include "base/UniqueFunction.h"
#include "platform/CallQualityService.h"
#include "platform/WorkQueue.h"
#include "platform/ZRReportingServiceProtocol.h"
#include "session/ZRReportingSessionMessage.h"
#include "util/AudioEvents.h"
#include "util/Context.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// What of one session is done on the call-quality worker's own queue: setting up, sending, stopping.
///
/// Setting up waits, at most nine seconds, until the service has found its back ends, and everything behind
/// it waits along. No thread does: while the agent waits its pieces stay in its list, and the completion, or
/// a delayed call, has them run. The list is also what keeps ten thousand sessions small; the serial queue is
/// given one piece whenever the list gets its first.
///
/// Owned by the worker. Pieces that may run hold the agent, so they run after the worker has gone. An agent
/// that waits is held by nobody else, unless a stop waits with it: a session that was dropped leaves nothing
/// behind, one that was stopped gets its summary, at the latest when the wait is over.
class LinkmeterAgent : public std::enable_shared_from_this<LinkmeterAgent> {
public:
    /// What the service is told of the session.
    struct Identity {
        ReporterID reporterID;
        AudioServiceType serviceType;
        std::string serviceName;
        Dictionary configuration;
    };
    struct Message {
        Dictionary payload;
        AudioEventCategory category;
        AudioEventType type;
    };

    explicit LinkmeterAgent(const Context& context) noexcept : context_(context) {}
    LinkmeterAgent(const LinkmeterAgent&) = delete;
    LinkmeterAgent& operator=(const LinkmeterAgent&) = delete;

    // Each posts its piece, without blocking. One thread at a time.
    void start(Identity identity);
    void send(Message message);
    /// The messages are nobody else's.
    void stop(std::vector<MessageRef> messages, AudioServiceType serviceType, ReporterID reporterID);

    /// Whether there is a session with back ends. Any thread.
    [[nodiscard]] bool getLinkmeterStartedState() const noexcept { return linkmeterSessionStarted_; }

private:
    struct Piece {
        /// As small as a message: nine seconds of them may wait.
        UniqueFunction<void(LinkmeterAgent&), sizeof(Message)> work;
        Pace pace = Pace::quick;
        bool isStop = false;
    };
    enum class Wait : std::uint8_t { none, waiting, signalled, timedOut };

    // Any thread.
    void post(Piece piece);
    void backendsFound(const std::optional<std::vector<std::string>>& backends);
    void signal();
    void timeOut(std::uint64_t waitNumber);

    // With the lock held.
    void handToQueue(Pace pace);
    void endWait(Wait outcome);

    // On the queue.
    void run(Pace pace);
    [[nodiscard]] bool mayGoOn(Pace pace);
    [[nodiscard]] bool takePieces();
    void setUp(const Identity& identity);
    void waitForBackends();
    void resume();
    void finishSetUp(bool isTimedOut);
    void handle(Message message);
    void sendMessage(Message message);
    void finish(const std::vector<MessageRef>& messages, AudioServiceType serviceType, ReporterID reporterID);
    void sendSummary(const std::vector<MessageRef>& messages, AudioServiceType serviceType,
                     ReporterID reporterID);

    const Context& context_;
    std::unique_ptr<SerialQueue> linkmeterQueue_; ///< made by the first post
    std::atomic<bool> linkmeterSessionStarted_{false};

    // Touched by the queue's pieces alone.
    CallQualityService::SessionRef linkmeterSession_;
    std::optional<std::string> linkmeterAgentToken_;
    std::unique_ptr<DelayedCall> timeOut_;
    std::vector<Piece> taken_;
    std::size_t nextTaken_ = 0;
    bool isWaiting_ = false;

    std::mutex mutex_; ///< guards what follows
    std::vector<Piece> posted_;
    bool isQueued_ = false;       ///< the queue has a piece, or a wait will give it one
    std::size_t stopsPosted_ = 0; ///< that have not run
    Wait wait_ = Wait::none;
    std::uint64_t waitNumber_ = 0;
    /// The count of the semaphore that the wait is for. It lasts: back ends that come too late for one run
    /// of the session are there at once for the next.
    unsigned signals_ = 0;
    std::shared_ptr<LinkmeterAgent> self_; ///< while a stop waits
};

} // namespace tamblo
