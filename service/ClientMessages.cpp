#include "platform/Counters.h"
#include "service/Answers.h"
#include "service/ZRReportingClientServerInstance.h"
#include "session/ZRReportingSession.h"
#include "util/Log.h"
#include "util/TraceEvents.h"

#include <algorithm>
#include <utility>

// What a client sends, on its way to the sessions.

namespace tamblo {

namespace {

constexpr std::string_view kErrorDomain = "com.vandra.audio.reporting";
constexpr std::int64_t kReportingDisabled = 1;
/// A message to several sessions is sent to so many at a time, and to fewer when it is large.
constexpr std::size_t kRecipientsAtOnce = 32;
constexpr std::size_t kBytesAtOnce = 64 * 1024;

} // namespace

/// A message on its way to several sessions. Whoever still has to do with it holds it; the client is answered
/// once nobody does, if all sessions have had it. One whose rest was dropped is not answered.
struct ZRReportingClientServerInstance::Sending {
    Dictionary message;
    std::uint32_t category;
    std::uint16_t type;
    bool isForStartedOnly; ///< those that are stopped meanwhile are left out
    std::vector<SessionRef> recipients;
    std::optional<StartedWalk> further; ///< recipients that are still to be found
    ErrorReply reply;
    std::size_t next = 0; ///< of the recipients
    std::size_t begun = 0;
    std::size_t answered = 0;
    bool isWhole = false; ///< all recipients have been begun with
    std::optional<ReplyError> refusal{};

    ~Sending() {
        if (reply && isWhole && answered == begun) {
            reply(refusal ? &*refusal : nullptr);
        }
    }
    /// On the server queue, whoever holds a reply back.
    void noteAnswer(const ReplyError* error) {
        ++answered;
        if (error != nullptr) {
            refusal = *error;
        }
    }
    [[nodiscard]] MessageRef record() const {
        return std::make_shared<ZRReportingSessionMessage>(message, category, type);
    }
};

bool ZRReportingClientServerInstance::isReportingEnabled() const noexcept {
    const Delegate delegate = delegate_.lock();
    return delegate != nullptr && delegate->isReportingEnabled();
}

void ZRReportingClientServerInstance::sendMessage(Dictionary message, std::uint32_t category,
                                                  std::uint16_t type, std::vector<ReporterID> reporterIDs,
                                                  ErrorReply reply) {
    if (reporterIDs.empty() && context_.isInternalBuild() && isReportingEnabled()) {
        message.set("sendSingleMessage", 1);
    }
    auto piece = [message = std::move(message), category, type, reporterIDs = std::move(reporterIDs),
                  reply = std::move(reply)](auto& client) mutable {
        client.performSend(std::move(message), category, type, reporterIDs, std::move(reply));
    };
    static_assert(sizeof(piece) + sizeof(ClientRef) <= kWorkInlineBytes,
                  "a queued message allocates nothing");
    onServerQueue(Pace::quick, std::move(piece));
}

void ZRReportingClientServerInstance::performSend(Dictionary message, std::uint32_t category,
                                                  std::uint16_t type,
                                                  const std::vector<ReporterID>& reporterIDs,
                                                  ErrorReply reply) {
    log::debug(ZRReportingServiceDelegateCategory(), "sending message for reporter {}",
               NumberList{reporterIDs});
    emitTracePoint(context_, TraceEvent::sendMessageRequest);
    const Delegate delegate = delegate_.lock();
    if (delegate == nullptr || !delegate->isReportingEnabled()) {
        counters::addAlone(counters::Counter::messagesRefusedDisabled);
        if (reply) {
            const ReplyError error{std::string(kErrorDomain), kReportingDisabled};
            reply(&error);
        }
        return;
    }
    requests_->tally().addMessage();
    recipients_.clear(); // of what a request without memory has left
    std::optional<StartedWalk> further;
    if (reporterIDs.empty()) {
        further = delegate->findFirstStarted(recipients_);
    } else {
        delegate->findReportingSessionsForIDs(reporterIDs, recipients_);
    }
    if (recipients_.empty()) {
        counters::addAlone(counters::Counter::messagesLostNoSession);
        answer(reply);
    } else if (recipients_.size() == 1 && !recipients_.front()->isStopping()) {
        // It is given the payload itself, which spares it a copy when it is normalised.
        requests_->chargeTo(recipients_.front()->processorTime());
        recipients_.front()->sendMessage(
            std::make_shared<ZRReportingSessionMessage>(std::move(message), category, type),
            std::move(reply));
        recipients_.clear();
    } else {
        sendSome(std::make_shared<Sending>(std::move(message), category, type, reporterIDs.empty(),
                                           std::exchange(recipients_, {}), further, std::move(reply)));
    }
}

void ZRReportingClientServerInstance::sendSome(const std::shared_ptr<Sending>& sending) {
    const std::size_t fitting = kBytesAtOnce / std::max<std::size_t>(heldBytes(sending->message), 1);
    const std::size_t atOnce = std::clamp<std::size_t>(fitting, 1, kRecipientsAtOnce);
    for (std::size_t left = atOnce; left != 0; --left) {
        if (!findRecipients(*sending)) {
            sending->isWhole = true;
            return;
        }
        const SessionRef& recipient = sending->recipients[sending->next];
        const bool isLeftOut =
            sending->isForStartedOnly && (!recipient->started() || recipient->isStopping());
        if (!isLeftOut && recipient->isStopping()) {
            goOnWhenStopped(*recipient, sending);
            return;
        }
        const SessionRef session = std::move(sending->recipients[sending->next++]);
        if (!isLeftOut) {
            ++sending->begun;
            requests_->chargeTo(session->processorTime());
            session->sendMessage(sending->record(),
                                 [sending](const ReplyError* error) { sending->noteAnswer(error); });
        }
    }
    afterTurnsOfOthers(Pace::quick, [sending](auto& client) { client.sendSome(sending); });
}

/// Sees to it that the next recipient is known, if there is one.
bool ZRReportingClientServerInstance::findRecipients(Sending& sending) const {
    if (sending.next != sending.recipients.size()) {
        return true;
    }
    const Delegate delegate = delegate_.lock();
    if (!sending.further || delegate == nullptr) {
        return false;
    }
    sending.recipients.clear();
    sending.next = 0;
    sending.further = delegate->findNextStarted(*sending.further, sending.recipients);
    return !sending.recipients.empty();
}

/// The message follows the stop, and what this client asks next follows the message.
void ZRReportingClientServerInstance::goOnWhenStopped(ZRReportingSession& session,
                                                      const std::shared_ptr<Sending>& sending) {
    session.whenStopped([client = shared_from_this(), sending] {
        if (!client->hasLeft_) {
            client->afterTurnsOfOthers(Pace::quick, [sending](auto& sender) { sender.sendSome(sending); });
        }
        client->requests_->resume();
    });
    requests_->suspend();
}

} // namespace tamblo
