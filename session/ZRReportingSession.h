#pragma once

#include "base/AllocatedBytes.h"
#include "base/Dictionary.h"
#include "platform/Clock.h"
#include "platform/MessageTap.h"
#include "platform/ZRReportingServiceProtocol.h"
#include "session/LastMessageIndex.h"
#include "session/MessageBlocks.h"
#include "session/MessageIntake.h"
#include "session/PreviousValues.h"
#include "session/RetainedMessages.h"
#include "session/SessionStop.h"
#include "session/WorkerClass.h"
#include "session/ZRReportingSessionMessage.h"
#include "session/ZRReportingSessionWorkerProtocol.h"
#include "util/AudioEvents.h"

#include <chrono>
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
/// Owned by a client instance; the single-message session by its keeper. Created (the start-on-init workers
/// run) → started (all workers run) → stopped (messages emptied, workers kept) → started again …; letting it
/// go stops nothing. Used on the reporting server queue alone.
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

    /// The rows of all worker classes, whether or not a session may have one.
    [[nodiscard]] static std::span<const WorkerClass> getAllWorkerClasses() { return workerClassList(); }

    void setServiceType(AudioServiceType serviceType);
    void setIsSingleMessageSession(bool isSingle) noexcept { isSingleMessageSession_ = isSingle; }
    void setClientProcessName(std::optional<std::string> name) { clientProcessName_ = std::move(name); }
    /// Adds the entries to the configuration, which is never replaced.
    void updateConfigurationWithContentsOfConfiguration(const Dictionary& configuration);
    /// What the configuration would be after that.
    [[nodiscard]] Dictionary configurationWith(const Dictionary& configuration) const;
    void addPreviousValues(const Dictionary& values) {
        remember(values, values.bytesOfValues(Dictionary::Shared::inProportion), false);
    }
    /// To whose budget of retained messages the session's count; at first, the service's own user's.
    void setUser(uid_t user) { retained_.setUser(user); }

    void start();
    /// Normalises the message, records it unless it is redundant, and offers it to the consumer workers,
    /// whether or not the session is started. The reply is called at the end. Between the parts of a stop,
    /// only by workers in their own `stop`: what others have to send waits until it is over.
    void sendMessage(const MessageRef& message, ErrorReply reply = {});
    /// For a worker that has to do something for the message at hand on another queue: keeps back the
    /// message's reply until the worker lets go of the token that this returns. Each call for one message
    /// returns the same token.
    [[nodiscard]] std::shared_ptr<const void> holdReply();
    void stop();
    /// Does the next part of the stop, some milliseconds of it, and answers whether the session is stopped.
    /// Between two parts the queue may do anything but start the session and send it messages.
    [[nodiscard]] bool stopSome();
    /// Ends a stop that cannot go on, of a session that is about to go: who waits for it goes on.
    void giveUpStop();
    /// Whether a stop has begun and is not over.
    [[nodiscard]] bool isStopping() const noexcept { return stop_ != nullptr; }
    /// For workers in their stop: so many messages that the worker has derived are still to be sent. Whether
    /// there is room for more, of what all stops of the user derive.
    [[nodiscard]] bool holdsDerived(std::size_t messages);
    /// For workers in their stop: the key set of each of the messages that there were when it began, so that
    /// a walk need not touch those that have no key that it looks for. Whoever changes a message's keys
    /// enters its new key set here. Empty for a worker that is stopped by itself.
    [[nodiscard]] std::span<const KeySet*> keySetsAtStop() noexcept;
    /// Calls back once the stop that is under way is over.
    void whenStopped(UniqueFunction<void()> call);

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
    /// What it takes, and goes on to take until it is next updated.
    [[nodiscard]] std::size_t configurationBytes() const noexcept { return configurationBytes_; }
    [[nodiscard]] ReporterID reporterID() const noexcept { return reporterID_; }
    [[nodiscard]] const std::vector<pid_t>& processIdentifiers() const noexcept {
        return processIdentifiers_;
    }
    [[nodiscard]] const std::optional<std::string>& clientProcessName() const noexcept {
        return clientProcessName_;
    }
    /// In arrival order, from the stop on in the order of their timestamps.
    [[nodiscard]] const std::vector<MessageRef>& messages() const noexcept { return messages_; }
    /// The latest value of each key, put together anew.
    [[nodiscard]] Dictionary previousValues() const { return previousValues_.values(); }
    /// Those of some keys.
    [[nodiscard]] Dictionary previousValuesOf(std::span<const std::string_view> keys) const {
        return previousValues_.valuesOf(keys);
    }
    [[nodiscard]] std::int64_t totalMessageCount() const noexcept { return totalMessageCount_; }
    /// When the session was last started, and stopped since then, by a clock that may have been set
    /// meanwhile.
    [[nodiscard]] std::optional<WallTime> startTime() const noexcept { return startTime_; }
    [[nodiscard]] std::optional<WallTime> stopTime() const noexcept { return stopTime_; }
    /// What the values of all messages take that were ever sent to the session.
    [[nodiscard]] std::uint64_t messageBytes() const noexcept { return messageBytes_; }
    /// What requests for the session have taken of the processor, which whoever carries them out adds up.
    [[nodiscard]] const std::shared_ptr<std::chrono::nanoseconds>& processorTime() const noexcept {
        return processorTime_;
    }
    /// What counts for the user's budget of retained messages.
    [[nodiscard]] std::size_t retainedBytes() const noexcept { return retained_.bytes(); }
    /// How many messages that were sent to the session were recorded since the last stop, its own records of
    /// start and stop aside, and those included that were let go since.
    [[nodiscard]] std::size_t acceptedMessageCount() const noexcept {
        return recordedCount() - ownRecordCount_;
    }
    /// Messages that were let go since the last stop, as the user retained too much.
    [[nodiscard]] std::uint64_t droppedMessageCount() const noexcept { return droppedMessageCount_; }
    /// Whether messages may be let go for the sake of others: not while a stop makes use of them, nor once
    /// all of them go.
    [[nodiscard]] bool maySpareMessages() const noexcept { return stop_ == nullptr && !isLeaving_; }
    /// Lets go of the oldest messages that have about so many bytes, and of the previous values where no
    /// message is left. The bytes that are free then. Only where that may be.
    std::size_t letGoOfOldest(std::size_t bytes, std::string_view limit);
    /// Lets go of some thousand messages of a session that is about to go, and is not stopping. Whether none
    /// is left.
    [[nodiscard]] bool letGoSome();
    /// How many workers the session has made, started or not.
    [[nodiscard]] std::size_t workerInstanceCount() const noexcept { return messageWorkers_.size(); }
    /// Of their classes, in the order in which they were made.
    [[nodiscard]] std::vector<std::string> workerNames() const;
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
    /// Called as this goes.
    struct HeldReply {
        HeldReply() = default;
        ~HeldReply();
        HeldReply(const HeldReply&) = delete;
        HeldReply& operator=(const HeldReply&) = delete;

        ErrorReply reply;
    };
    struct Worker {
        const WorkerClass* workerClass;
        std::shared_ptr<ZRReportingSessionWorkerProtocol> instance;
    };

    /// A message, what `make_shared` adds, and its place in the list, which grows to twice what it needs.
    static constexpr std::size_t kBytesOfMessage =
        allocatedBytes(sizeof(ZRReportingSessionMessage) + 2 * sizeof(void*)) + 2 * sizeof(MessageRef);

    void startWorkersFromClasses(std::span<const WorkerClass* const> classes);
    void makeWorker(const WorkerClass& workerClass);
    [[nodiscard]] bool hasWorkerOf(const WorkerClass& workerClass) const noexcept;
    void stopNextPart();
    void orderWorkersToStop();
    void indexSomeAgain();
    void stopSomeOfWorkers();
    void letGoOfPast();
    void endStop();
    [[nodiscard]] bool letGoSomeOf(std::vector<MessageRef>& messages);
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
    void record(const MessageRef& message, std::size_t bytesOfValues, TappedMessage::Origin origin);
    void offerToTap(const ZRReportingSessionMessage& message, TappedMessage::Origin origin);
    /// Takes the values into the previous ones; `bytesOfValues` as they count for the user's budget.
    void remember(const Dictionary& payload, std::size_t bytesOfValues, bool isRecorded);
    void accept(const MessageRef& message);
    [[nodiscard]] std::size_t recordedCount() const noexcept {
        return messages_.size() + droppedMessageCount_;
    }
    void normalise(ZRReportingSessionMessage& message) const;
    void deliver(const MessageRef& message);

    Context& context_;
    MessageTap& tap_;
    intake::AudioTags& audioTags_;
    intake::Normaliser& normaliser_;
    const ReporterID reporterID_;
    const std::vector<pid_t> processIdentifiers_;
    bool started_ = false;
    bool isLeaving_ = false; ///< its messages are let go in parts
    bool isSingleMessageSession_ = false;
    AudioServiceType serviceType_ = AudioServiceTypeUnknown;
    std::string_view serviceName_ = ZRReportingServiceNameUnknown;
    std::optional<std::string> clientProcessName_;
    Dictionary configuration_;
    std::size_t configurationBytes_ = 0;
    /// What the configuration names as the application; payloads share it.
    Value appName_;
    BooleanReply transactionCompleteBlock_;

    std::vector<MessageRef> messages_;
    MessageBlocks blocks_;         ///< what the messages take
    std::size_t derivedBytes_ = 0; ///< of those that workers sent in the stop
    LastMessageIndex lastMessages_;
    PreviousValues previousValues_;
    std::size_t previousBytes_ = 0; ///< as the budget counts them
    std::optional<WallTime> startTime_;
    std::optional<WallTime> stopTime_;
    std::int64_t totalMessageCount_ = 0;
    std::uint64_t messageBytes_ = 0;
    const std::shared_ptr<std::chrono::nanoseconds> processorTime_ =
        std::make_shared<std::chrono::nanoseconds>(0);
    std::size_t ownRecordCount_ = 0; ///< among those recorded
    std::uint64_t droppedMessageCount_ = 0;

    std::vector<Worker> messageWorkers_;   ///< as they were made
    std::shared_ptr<HeldReply> heldReply_; ///< of the message that is being handled, once one is held
    std::unique_ptr<SessionStop> stop_;    ///< while one is under way

    RetainedMessages::Share retained_;
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
