#pragma once

#include "base/Mutex.h"
#include "base/UniqueFunction.h"
#include "os/FileDescriptor.h"
#include "platform/StructuredLog.h"
#include "platform/WorkQueue.h"
#include "platform/linux/connections/ListeningSocket.h"
#include "platform/linux/loop/EventLoop.h"
#include "platform/linux/status/StatusRequest.h"

#include <chrono>
#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <sys/types.h>

namespace tamblo {

/// What the status socket sends.
class StatusAnswers {
public:
    /// Makes the text, of what has been gathered; on the status queue, so that nobody else waits for it.
    using Text = UniqueFunction<std::string()>;
    /// Called once, on any thread, or never.
    using Reply = UniqueFunction<void(Text text)>;

    virtual ~StatusAnswers() = default;
    /// On the status queue.
    virtual void answer(const StatusRequest& request, Reply reply) = 0;
};

/// The second socket of the service, on which it tells how it is: a reader connects, sends a line, and is
/// sent one document and the end of the connection. Whoever sends nothing for a moment, or ends its sending,
/// is sent the status.
///
/// While there are readers, a piece of work of a queue of its own serves them all, so that a thread of the
/// pool waits for them; while there are none, the event loop watches the socket, and nothing wakes up. So
/// many readers at a time are served, others are told so. Each has its time for its line and for each step in
/// reading; one that does not read is let go. Where all places are taken, one of the user who has most of
/// them makes room for a user who has fewer, so that nobody keeps others out. Nothing here waits for the
/// server queue: what is asked of it comes when it comes, or the reader is told that it has not.
class StatusSocket final : public EventSource {
public:
    static constexpr std::size_t kMostReaders = 16;
    /// A line, or the headers of a request.
    static constexpr std::size_t kMostBytesOfLine = 8192;
    /// Of all documents that readers have not read to their end.
    static constexpr std::size_t kMostBytes = 64U << 20U;

    /// All must outlive the socket; the queues' work ends before it goes.
    StatusSocket(EventLoop& loop, WorkQueues& queues, StructuredLog& log, StatusAnswers& answers);
    ~StatusSocket() override;

    /// Takes over the second socket of socket activation or binds one in the directory. A text says what is
    /// in the way.
    [[nodiscard]] std::optional<std::string> open(const std::string& runtimeDirectory);
    /// Who takes over readers whose line is `tap FILTER`; called on the status queue. Before `resume`.
    using TakeTap = UniqueFunction<void(FileDescriptor reader, std::string_view filter)>;
    void setTaps(TakeTap takeTap) { takeTap_ = std::move(takeTap); }
    /// Readers are served from now on, if it is open. On the loop's thread, as is what follows.
    void resume() TAMBLO_EXCLUDES(mutex_);
    void ready(std::uint32_t events) override TAMBLO_EXCLUDES(mutex_);
    /// No reader is served any more, and those there are go.
    void stop() TAMBLO_EXCLUDES(mutex_);

private:
    struct Answer;
    struct Reader;
    class WakeUp;
    using Time = std::chrono::steady_clock::time_point;

    // The status queue's.
    void serve() TAMBLO_EXCLUDES(mutex_);
    [[nodiscard]] bool waitForReaders();
    void acceptReaders();
    [[nodiscard]] int timeLeft() const;
    /// Whether there is a place for one more of the user's readers, maybe another user's.
    [[nodiscard]] bool makeRoomFor(uid_t user);
    static void turnAway(FileDescriptor socket);
    void step(Reader& reader, short events, Time now);
    void receive(Reader& reader, Time now);
    void ask(Reader& reader, Time now);
    void takeAnswer(Reader& reader, Time now);
    /// What the reader is sent from now on.
    static void reply(Reader& reader, std::shared_ptr<const std::string> text, const StatusRequest* request,
                      Time now);
    static void refuse(Reader& reader, std::string_view error, Time now);
    /// Whether there is room for a document besides those that are being read.
    [[nodiscard]] bool hasRoomFor(const std::shared_ptr<const std::string>& text) const;
    void send(Reader& reader, Time now);
    static void close(Reader& reader);
    [[nodiscard]] bool isStopped() TAMBLO_EXCLUDES(mutex_);

    EventLoop& loop_;
    WorkQueues& queues_;
    StructuredLog& log_;
    StatusAnswers& answers_;
    TakeTap takeTap_;
    ListeningSocket socket_;
    const std::shared_ptr<WakeUp> wakeUp_;
    std::unique_ptr<SerialQueue> queue_;
    // The queue's.
    std::vector<Reader> readers_;
    Time acceptsFrom_{}; ///< later than now while there are no descriptors

    Mutex mutex_;
    bool isWatched_ TAMBLO_GUARDED_BY(mutex_) = false; ///< by the loop
    bool isStopped_ TAMBLO_GUARDED_BY(mutex_) = true;
};

} // namespace tamblo
