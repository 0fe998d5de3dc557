#pragma once

#include "base/Dictionary.h"
#include "platform/Clock.h"
#include "platform/ZRReportingServiceProtocol.h"
#include "session/LastMessageIndex.h"
#include "session/MessageIntake.h"
#include "session/WorkerClass.h"
#include "session/ZRReportingSessionMessage.h"
#include "session/ZRReportingSessionWorkerProtocol.h"
#include "util/AudioEvents.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include <sys/types.h>

namespace tamblo {

/// One reporter's session: its identity, service type and configuration, the messages accepted since its
/// start, and one worker of each applicable class.
///
/// Owned by a client instance, or by `LeavingClients` once the client has left; the single-message session by
/// its keeper. Created (the start-on-init workers run) → started (all workers run) → stopped (messages
/// emptied, workers kept) → started again …; letting it go stops nothing. Used on the reporting server queue
/// alone.
class ZRReportingSession : public std::enable_shared_from_this<ZRReportingSession> {
    struct Created {
        explicit Created() = default;
    };

public:
    /// A session whose start-on-init workers are made and started.
    [[nodiscard]] static std::shared_ptr<ZRReportingSession>
    initWithID(Context& context, ReporterID reporterID, std::vector<pid_t> processIdentifiers);
    ZRReportingSession(Created, Context& context, ReporterID reporterID,
                       std::vector<pid_t> processIdentifiers);
    ~ZRReportingSession();
    ZRReportingSession(const ZRReportingSession&) = delete;
    ZRReportingSession& operator=(const ZRReportingSession&) = delete;

    /// Nothing here asks for them yet.
    [[nodiscard]] static std::span<const WorkerClass> getAllWorkerClasses() { return workerClassList(); }

    void setServiceType(AudioServiceType serviceType);
    void setIsSingleMessageSession(bool isSingle) noexcept { isSingleMessageSession_ = isSingle; }
    void setClientProcessName(std::optional<std::string> name) { clientProcessName_ = std::move(name); }
    /// Adds the entries to the configuration, which is never replaced.
    void updateConfigurationWithContentsOfConfiguration(const Dictionary& configuration);
    void addPreviousValues(const Dictionary& values) { previousValues_.merge(values); }

    void start();
    /// Normalises the message, records it unless it is redundant, and offers it to the consumer workers,
    /// whether or not the session is started. May be called by a worker in its `stop`. The reply, which
    /// nothing here gives yet, is called at the end.
    void sendMessage(const MessageRef& message, ErrorReply reply = {});
    void stop();

    /// The start reply that waits for the stop; empty when none does.
    void setTransactionCompleteBlock(BooleanReply reply) { transactionCompleteBlock_ = std::move(reply); }
    [[nodiscard]] BooleanReply takeTransactionCompleteBlock() noexcept {
        return std::move(transactionCompleteBlock_);
    }

    [[nodiscard]] bool started() const noexcept { return started_; }
    [[nodiscard]] bool isSingleMessageSession() const noexcept { return isSingleMessageSession_; }
    [[nodiscard]] AudioServiceType serviceType() const noexcept { return serviceType_; }
    [[nodiscard]] std::string_view serviceName() const noexcept { return serviceName_; }
    [[nodiscard]] const Dictionary& configuration() const noexcept { return configuration_; }
    [[nodiscard]] ReporterID reporterID() const noexcept { return reporterID_; }
    [[nodiscard]] const std::vector<pid_t>& processIdentifiers() const noexcept {
        return processIdentifiers_;
    }
    [[nodiscard]] const std::optional<std::string>& clientProcessName() const noexcept {
        return clientProcessName_;
    }
    /// In arrival order, from the stop on in the order of their timestamps.
    [[nodiscard]] const std::vector<MessageRef>& messages() const noexcept { return messages_; }
    [[nodiscard]] const Dictionary& previousValues() const noexcept { return previousValues_; }
    [[nodiscard]] std::int64_t totalMessageCount() const noexcept { return totalMessageCount_; }
    /// How many of `messages` were sent to the session, its own records of start and stop aside.
    [[nodiscard]] std::size_t acceptedMessageCount() const noexcept {
        return messages_.size() - ownRecordCount_;
    }
    /// Nothing here asks for it yet.
    [[nodiscard]] std::size_t workerInstanceCount() const noexcept { return messageWorkers_.size(); }
    [[nodiscard]] std::string description() const;

    /// What makes a message uniform, in this order; `session/MessageIntake.h` says how.
    static void addMissingDates(ZRReportingSessionMessage& message, WallTime now);
    static void removeWhiteSpaceFromKeys(ZRReportingSessionMessage& message);
    static void addAudioMessageTag(ZRReportingSessionMessage& message, intake::AudioTags& tags);
    void addAppName(ZRReportingSessionMessage& message) const;
    /// Whether the message says, times aside, what the last accepted one of its category and type said.
    [[nodiscard]] bool messageIsRedundant(const ZRReportingSessionMessage& message) const;
    [[nodiscard]] static double
    getEpochTimeFromZRReportingStateMessage(const ZRReportingSessionMessage& message) noexcept;

private:
    struct Worker {
        const WorkerClass* workerClass;
        std::shared_ptr<ZRReportingSessionWorkerProtocol> instance;
    };

    void startWorkersFromClasses(std::span<const WorkerClass* const> classes);
    void makeWorker(const WorkerClass& workerClass);
    [[nodiscard]] bool hasWorkerOf(const WorkerClass& workerClass) const noexcept;
    void stopWorkers();
    /// Calls `act` with each worker once: those of the first role, then those of the second, then all others.
    template <typename Act>
    void forEachWorker(bool WorkerRole::*first, bool WorkerRole::*second, Act act) const {
        for (const int turn : {0, 1, 2}) {
            for (const Worker& worker : messageWorkers_) {
                const WorkerRole& role = worker.workerClass->role;
                if (turn == (role.*first ? 0 : role.*second ? 1 : 2)) {
                    act(worker);
                }
            }
        }
    }
    /// Records a message of the session's own, which no worker is offered.
    void recordOwnMessage(AudioEventType type, std::string_view method);
    void record(MessageRef message);
    void normalise(ZRReportingSessionMessage& message) const;
    void deliver(const MessageRef& message);

    Context& context_;
    intake::AudioTags& audioTags_;
    const ReporterID reporterID_;
    const std::vector<pid_t> processIdentifiers_;
    bool started_ = false;
    bool isSingleMessageSession_ = false;
    AudioServiceType serviceType_ = AudioServiceTypeUnknown;
    std::string_view serviceName_ = ZRReportingServiceNameUnknown;
    std::optional<std::string> clientProcessName_;
    Dictionary configuration_;
    /// What the configuration names as the application; payloads share it.
    Value appName_;
    BooleanReply transactionCompleteBlock_;

    std::vector<MessageRef> messages_;
    LastMessageIndex lastMessages_;
    Dictionary previousValues_;
    std::int64_t totalMessageCount_ = 0;
    std::size_t ownRecordCount_ = 0; ///< among the messages

    std::vector<Worker> messageWorkers_; ///< as they were made
};

void appendText(std::string& out, const ZRReportingSession& session);

/// Several sessions in a log line: "[first, second]"; of more than fit a line that somebody reads, the first
/// ones and how many there are besides.
struct SessionList {
    static constexpr std::size_t kMost = 16;

    std::span<const std::shared_ptr<ZRReportingSession>> sessions;
    std::size_t count; ///< of all sessions; `sessions` need not hold more than `kMost` of them
};
void appendText(std::string& out, const SessionList& list);

} // namespace tamblo
