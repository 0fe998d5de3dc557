#pragma once

#include "base/Dictionary.h"
#include "client/Engine.h"
#include "client/MessageWriter.h"
#include "client/Reply.h"
#include "client/Vocabulary.h"

#include <chrono>
#include <cstdint>
#include <future>
#include <memory>
#include <span>
#include <string>
#include <vector>

namespace tamblo::client {

/// Which of the service's answers to a request the callback wants. Some requests are answered twice: the
/// service type of reporter 0, and the start of a "test" reporter on an internal build.
enum class Replies : std::uint8_t {
    first, ///< the callback is called once; later answers are dropped
    every, ///< the callback is kept until the connection ends, and called a last time with an error then
};

/// A connection to the reporting service.
///
/// With `Threading::background`, which is the default, a thread of the library's own sends and receives, and
/// any thread may call. With `Threading::caller` there is no other thread: the caller pumps with `run`,
/// `wait` or `flush`, and only one thread uses the client. Callbacks run on the pumping thread, must not
/// throw, and may send requests, but must not pump or destroy the client.
///
/// Sending never blocks. A request is written straight into a bounded queue; when that is full it is refused,
/// counted, and its callback is dropped uncalled. What a call costs the calling thread in background mode:
/// no lock, no system call but at most one non-blocking write that wakes the library's thread when that
/// sleeps, and no allocation as long as the request's frame is at most 1,024 bytes and its callback captures
/// at most 48. This holds for requests without a callback, for those with one, and for `message`; the
/// overloads that return a future allocate.
///
/// When the service goes away, every request that was sent and not answered is answered with the error
/// `ErrorCode::connectionLost`, the state callback says `lost` and `reconnecting`, and attempts to connect
/// follow. What is sent meanwhile waits in the queue. The new service knows nothing of sessions: make them
/// anew in the state callback when it says `connected`; what is sent from within that callback goes ahead of
/// all that waits.
///
///     Client client({.onState = [&client](ConnectionState state) {
///         if (state == ConnectionState::connected) {
///             client.createReportingSession(7, nullptr);
///             client.setServiceType(ServiceType::longFormAudio, 7, nullptr);
///             client.startReportingSessionForID(7, nullptr);
///         }
///     }});
///     client.post({{"volume", 0.5}}, category(EventKind::volume), EventType::generic, {7});
class Client {
public:
    enum class Threading : std::uint8_t { background, caller };

    struct Options {
        /// Empty: the service's usual place, see `wire::Directories`.
        std::string socketPath{};
        Threading threading = Threading::background;
        /// Requests that may wait to be sent; each takes some 1,200 bytes from the start.
        std::size_t queueCapacity = 1024;
        /// Without it, everything is answered with an error once the service cannot be reached.
        bool reconnect = true;
        /// How long the destructor goes on sending what is queued.
        std::chrono::milliseconds linger{1000};
        StateFunction onState{};
    };

    Client() : Client(Options{}) {}
    explicit Client(Options options);
    /// Sends what is queued, within the linger time, and answers what waits with `ErrorCode::closed`.
    ~Client();
    Client(const Client&) = delete;
    Client& operator=(const Client&) = delete;

    /// The requests. Each answers whether it was queued. An empty callback (`nullptr`) asks the
    /// service for no reply. A start is answered when the session stops, or never.
    bool createReportingSession(std::int64_t reporterID, Callback<bool> callback);
    bool setServiceType(ServiceType type, std::int64_t reporterID, Callback<bool> callback);
    bool getServiceNameForReporterID(std::int64_t reporterID, Callback<ServiceType> callback,
                                     Replies replies = Replies::first);
    bool setConfiguration(const Dictionary& configuration, std::int64_t reporterID, Callback<bool> callback);
    bool startReportingSessionForID(std::int64_t reporterID, Callback<bool> callback,
                                    Replies replies = Replies::first);
    bool sendMessage(const Dictionary& payload, EventCategory category, EventType type,
                     std::span<const std::int64_t> reporterIDs, Callback<Nothing> callback);
    bool stopReportingSessionForID(std::int64_t reporterID, Callback<bool> callback);
    bool destroyReportingSession(std::int64_t reporterID, Callback<bool> callback);
    bool reporterID(std::int64_t reporterID, Callback<Dictionary> callback);
    bool getAllReporters(Callback<std::vector<std::int64_t>> callback);
    /// The service never answers: success is the loss of the connection.
    bool killService(Callback<bool> callback);

    /// The same with futures, which are always made good: a request that was refused, lost or cut off by the
    /// client's end has an error. In caller mode wait for them with `wait`.
    std::future<Result<bool>> createReportingSession(std::int64_t reporterID);
    std::future<Result<bool>> setServiceType(ServiceType type, std::int64_t reporterID);
    std::future<Result<ServiceType>> getServiceNameForReporterID(std::int64_t reporterID);
    std::future<Result<bool>> setConfiguration(const Dictionary& configuration, std::int64_t reporterID);
    std::future<Result<bool>> startReportingSessionForID(std::int64_t reporterID);
    std::future<Result<Nothing>> sendMessage(const Dictionary& payload, EventCategory category,
                                             EventType type, std::span<const std::int64_t> reporterIDs);
    std::future<Result<bool>> stopReportingSessionForID(std::int64_t reporterID);
    std::future<Result<bool>> destroyReportingSession(std::int64_t reporterID);
    std::future<Result<Dictionary>> reporterID(std::int64_t reporterID);
    std::future<Result<std::vector<std::int64_t>>> getAllReporters();
    std::future<Result<bool>> killService();

    /// A message that wants no answer. Without reporter IDs it goes to every started session of every client,
    /// or, when none is started, to the service's single-message session.
    bool post(const Dictionary& payload, EventCategory category, EventType type,
              std::span<const std::int64_t> reporterIDs = {});
    bool post(const Dictionary& payload, EventCategory category, EventType type,
              std::initializer_list<std::int64_t> reporterIDs);
    /// The same, written entry by entry.
    [[nodiscard]] MessageWriter message() { return MessageWriter(*engine_); }

    /// Requests that were not queued: the queue was full, or they were longer than the service accepts.
    [[nodiscard]] std::uint64_t refusedMessages() const noexcept { return engine_->refused(); }
    [[nodiscard]] bool isConnected() const noexcept { return engine_->isConnected(); }
    [[nodiscard]] const std::string& socketPath() const noexcept { return engine_->socketPath(); }

    /// Whether all that was queued has been handed to the kernel, at the latest after this time. Pumps in
    /// caller mode.
    bool flush(std::chrono::milliseconds timeout);

    /// Caller mode. `connect` tries at once. `run` sends and receives for at most this long, and returns the
    /// number of replies that it handled as soon as there are any, or 0 early when the connection changed.
    bool connect() { return engine_->connect(); }
    std::size_t run(std::chrono::milliseconds timeout) { return engine_->pump(timeout); }
    /// Caller mode, for a program with a loop of its own: the descriptor to watch for reading, and for
    /// writing while `flush` with no time says that something is left; then `run` or `flush` with no time do
    /// not wait. -1 without a connection; another one after the next connect.
    [[nodiscard]] int descriptor() const noexcept { return engine_->descriptor(); }

    /// Whether the future is ready, at the latest after this time. Pumps in caller mode: then a request and
    /// its reply are one system call each.
    template <typename T> bool wait(std::future<T>& future, std::chrono::milliseconds timeout) {
        if (thread_) {
            return future.wait_for(timeout) == std::future_status::ready;
        }
        const auto deadline = std::chrono::steady_clock::now() + timeout;
        while (future.wait_for(std::chrono::seconds(0)) != std::future_status::ready) {
            const auto left =
                std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
            if (left.count() <= 0) {
                return false;
            }
            run(left);
        }
        return true;
    }

private:
    class PumpThread;

    std::chrono::milliseconds linger_;
    std::unique_ptr<Engine> engine_;
    std::unique_ptr<PumpThread> thread_; ///< in background mode
};

} // namespace tamblo::client
