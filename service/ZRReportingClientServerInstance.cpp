#include "service/ZRReportingClientServerInstance.h"

#include "platform/Counters.h"
#include "session/ZRReportingSession.h"
#include "util/AudioEvents.h"
#include "util/Log.h"
#include "util/MessageKeys.h"
#include "util/TraceEvents.h"

#include <algorithm>
#include <new>
#include <utility>

namespace tamblo {

namespace {

constexpr std::string_view ZRReporterProxyKeyReporterID = "reporterID";
constexpr std::string_view ZRReporterProxyKeyServiceType = "serviceType";
constexpr std::string_view kErrorDomain = "com.vandra.audio.reporting";
constexpr std::int64_t kReportingDisabled = 1;
/// How many sessions of a client that leaves are let go in one piece of work; of started ones, one.
constexpr std::size_t kSessionsLeftAtOnce = 16;
constexpr int kExitStatusKilled = 2;
/// A message to several sessions is sent to so many at a time, and to fewer when it is large.
constexpr std::size_t kRecipientsAtOnce = 32;
constexpr std::size_t kBytesAtOnce = 64 * 1024;

template <typename Reply, typename... Result> void answer(Reply& reply, const Result&... result) {
    if (reply) {
        reply(nullptr, result...);
    }
}

void refuse(BooleanReply& reply, const ReplyError& error) {
    if (reply) {
        reply(&error, false);
    }
}

/// The bytes of the longest name of the application that a configuration gives.
std::size_t applicationNameBytes(const Dictionary& configuration) {
    std::size_t longest = 0;
    for (const auto key : {ZRReportingApplicationName, ZRReportingMessageQVHostApplicationDisplayID}) {
        const Value* const name = configuration.find(key);
        if (name != nullptr) {
            longest = std::max(longest, name->isString() ? name->stringValue().size() : name->heldBytes());
        }
    }
    return longest;
}

/// One that was never stopped may retain hundreds of thousands of messages.
void letGoInParts(Context& context, SessionRef session) {
    if (!session->letGoSome()) {
        context.serverQueue().post([&context, session = std::move(session)]() mutable {
            letGoInParts(context, std::move(session));
        });
    }
}

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

ZRReportingClientServerInstance::ZRReportingClientServerInstance(
    Context& context, Acceptance acceptance, std::shared_ptr<RequestQueue> requests,
    std::weak_ptr<ZRReportingServiceDelegateProtocol> delegate)
    : context_(context),
      acceptance_(std::move(acceptance)),
      requests_(std::move(requests)),
      delegate_(std::move(delegate)) {
    log::standard(ZRReportingServiceDelegateCategory(), "new client with pid {}", processIdentifier());
}

ZRReportingClientServerInstance::~ZRReportingClientServerInstance() {
    log::standard(ZRReportingServiceDelegateCategory(), "dealloc {} from the server client list",
                  processIdentifier());
}

template <typename Piece> void ZRReportingClientServerInstance::onServerQueue(Pace pace, Piece piece) {
    auto work = [client = shared_from_this(), piece = std::move(piece)]() mutable { piece(*client); };
    requests_->post(std::move(work), pace);
}

template <typename Piece> void ZRReportingClientServerInstance::afterTurnsOfOthers(Pace pace, Piece piece) {
    auto work = [client = shared_from_this(), piece = std::move(piece)]() mutable { piece(*client); };
    requests_->postNext(std::move(work), pace);
}

void ZRReportingClientServerInstance::createReportingSession(ReporterID reporterID, BooleanReply reply) {
    onServerQueue(Pace::quick, [reporterID, reply = std::move(reply)](auto& client) mutable {
        client.performCreate(reporterID, std::move(reply));
    });
}

void ZRReportingClientServerInstance::performCreate(ReporterID reporterID, BooleanReply reply) {
    log::debug(ZRReportingServiceDelegateCategory(), "creating session for reporter {}", reporterID);
    emitTracePoint(context_, TraceEvent::createReportingSession);
    if (!clientReportingSessionMap_.contains(reporterID)) {
        if (const auto refused = beyondLimitOfSessions()) {
            refuse(reply, *refused);
            return;
        }
    }
    storeSession(reporterID, makeSession(reporterID));
    log::standard(ZRReportingServiceDelegateCategory(), "session created for reporter {}", reporterID);
    answer(reply, true);
}

std::optional<ReplyError> ZRReportingClientServerInstance::beyondLimitOfSessions() const {
    const Limits& limits = context_.platform().limits;
    if (clientReportingSessionMap_.size() >= limits.sessionsOfConnection) {
        return limitReached("sessions_of_connection", limits.sessionsOfConnection);
    }
    const UserAccount* const all = account();
    if (all != nullptr && all->sessions() >= limits.sessionsOfUser) {
        return limitReached("sessions_of_user", limits.sessionsOfUser);
    }
    return std::nullopt;
}

void ZRReportingClientServerInstance::setServiceType(std::uint16_t serviceType, ReporterID reporterID,
                                                     BooleanReply reply) {
    onServerQueue(Pace::quick, [serviceType, reporterID, reply = std::move(reply)](auto& client) mutable {
        client.performSetServiceType(serviceType, reporterID);
        answer(reply, true);
    });
}

void ZRReportingClientServerInstance::performSetServiceType(std::uint16_t serviceType,
                                                            ReporterID reporterID) {
    log::debug(ZRReportingServiceDelegateCategory(), "setting service type {} for reporter {}", serviceType,
               reporterID);
    const SessionRef session = reporterID != 0 ? findReportingSessionForID(reporterID, false) : nullptr;
    if (session == nullptr) {
        return;
    }
    if (session->serviceType() == serviceType) {
        session->setServiceType(serviceType);
    } else {
        // The old session goes without a stop, and the new one is not started.
        SessionRef replacement = makeSession(reporterID);
        replacement->updateConfigurationWithContentsOfConfiguration(session->configuration());
        replacement->addPreviousValues(session->previousValues());
        replacement->setServiceType(serviceType);
        storeSession(reporterID, std::move(replacement));
    }
    log::standard(ZRReportingServiceDelegateCategory(), "service type {} set for reporter  {}", serviceType,
                  reporterID);
}

void ZRReportingClientServerInstance::getServiceNameForReporterID(ReporterID reporterID,
                                                                  ServiceTypeReply reply) {
    onServerQueue(Pace::quick, [reporterID, reply = std::move(reply)](auto& client) mutable {
        log::debug(ZRReportingServiceDelegateCategory(), "fetching seviceType");
        if (reporterID == 0) {
            // Clients count on both answers.
            answer(reply, AudioServiceTypeUnknown);
        }
        const SessionRef session = client.findReportingSessionForID(reporterID, true);
        const AudioServiceType serviceType =
            session != nullptr ? session->serviceType() : AudioServiceTypeUnknown;
        answer(reply, serviceType);
        log::standard(ZRReportingServiceDelegateCategory(), "returning service type {} for reporter  {}",
                      serviceType, reporterID);
    });
}

void ZRReportingClientServerInstance::setConfiguration(Dictionary configuration, ReporterID reporterID,
                                                       BooleanReply reply) {
    onServerQueue(Pace::quick, [configuration = std::move(configuration), reporterID,
                                reply = std::move(reply)](auto& client) mutable {
        client.performSetConfiguration(configuration, reporterID, std::move(reply));
    });
}

void ZRReportingClientServerInstance::performSetConfiguration(const Dictionary& configuration,
                                                              ReporterID reporterID, BooleanReply reply) {
    log::debug(ZRReportingServiceDelegateCategory(), "setting configuration");
    if (const SessionRef session = findReportingSessionForID(reporterID, false)) {
        const std::size_t before = session->configurationBytes();
        const std::size_t after = heldBytes(session->configurationWith(configuration));
        if (const auto refused = beyondLimitOfConfiguration(configuration, before, after)) {
            refuse(reply, *refused);
            return;
        }
        session->updateConfigurationWithContentsOfConfiguration(configuration);
        if (UserAccount* const all = account()) {
            all->changeConfiguration(before, session->configurationBytes());
        }
    }
    answer(reply, true);
}

std::optional<ReplyError>
ZRReportingClientServerInstance::beyondLimitOfConfiguration(const Dictionary& added, std::size_t before,
                                                            std::size_t after) const {
    const Limits& limits = context_.platform().limits;
    if (applicationNameBytes(added) > limits.applicationNameBytes) {
        return limitReached("application_name_bytes", limits.applicationNameBytes);
    }
    if (after > limits.configurationBytesOfSession) {
        return limitReached("configuration_bytes_of_session", limits.configurationBytesOfSession);
    }
    const UserAccount* const account = this->account();
    const std::size_t all = account != nullptr ? account->configurationBytes() : 0;
    if (after > before && all + (after - before) > limits.configurationBytesOfUser) {
        return limitReached("configuration_bytes_of_user", limits.configurationBytesOfUser);
    }
    return std::nullopt;
}

UserAccount* ZRReportingClientServerInstance::account() const {
    const Delegate delegate = delegate_.lock();
    return delegate != nullptr ? &delegate->accountOf(user()) : nullptr;
}

void ZRReportingClientServerInstance::startReportingSessionForID(ReporterID reporterID, BooleanReply reply) {
    onServerQueue(Pace::mayBlock, [reporterID, reply = std::move(reply)](auto& client) mutable {
        client.performStart(reporterID, std::move(reply));
    });
}

void ZRReportingClientServerInstance::performStart(ReporterID reporterID, BooleanReply reply) {
    log::debug(ZRReportingServiceDelegateCategory(), "starting session for reporter {}", reporterID);
    emitTracePoint(context_, TraceEvent::startReportingSession);
    const SessionRef session = reporterID != 0 ? findReportingSessionForID(reporterID, false) : nullptr;
    if (session == nullptr) {
        answer(reply, true);
        return;
    }
    if (session->started()) {
        return; // meant: the start of a started session is never answered
    }
    session->start();
    sessionChanged(reporterID, session);
    BooleanReply earlier = session->takeTransactionCompleteBlock();
    answer(earlier, true);
    if (session->serviceType() == AudioServiceTypeTest && context_.isInternalBuild()) {
        answer(reply, true);
    }
    session->setTransactionCompleteBlock(std::move(reply));
    logReportingSessions();
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

void ZRReportingClientServerInstance::stopReportingSessionForID(ReporterID reporterID, BooleanReply reply) {
    onServerQueue(Pace::mayBlock, [reporterID, reply = std::move(reply)](auto& client) mutable {
        client.performStop(reporterID, std::move(reply));
    });
}

void ZRReportingClientServerInstance::performStop(ReporterID reporterID, BooleanReply reply) {
    log::debug(ZRReportingServiceDelegateCategory(), "stopping session for reporter {}", reporterID);
    emitTracePoint(context_, TraceEvent::stopReportingSession);
    if (reporterID == 0) {
        answer(reply, true);
        return;
    }
    const SessionRef session = findReportingSessionForID(reporterID, false);
    if (session != nullptr && session->started()) {
        stopThen(session, [reporterID, session, reply = std::move(reply)](auto& client) mutable {
            client.finishStop(reporterID, session, std::move(reply));
        });
        if (session->isStopping()) {
            sessionChanged(reporterID, session);
        }
        return;
    }
    log::debug(ZRReportingServiceDelegateCategory(),
               "Stop called, but session==nil or session.started==false. reporterID={} session={} "
               "session.started={}",
               reporterID, session, session != nullptr && session->started());
    log::standard(ZRReportingServiceDelegateCategory(), "stopping {}", reporterID);
    answer(reply, true);
}

void ZRReportingClientServerInstance::finishStop(ReporterID reporterID, const SessionRef& session,
                                                 BooleanReply reply) {
    sessionChanged(reporterID, session);
    BooleanReply held = session->takeTransactionCompleteBlock();
    answer(held, true);
    logReportingSessions();
    log::standard(ZRReportingServiceDelegateCategory(), "stopping {}", reporterID);
    answer(reply, true);
}

template <typename Finish>
void ZRReportingClientServerInstance::stopThen(const SessionRef& session, Finish finish) {
    requests_->chargeTo(session->processorTime());
    if (session->stopSome()) {
        finish(*this);
        return;
    }
    afterTurnsOfOthers(Pace::mayBlock, [session, finish = std::move(finish)](auto& client) mutable {
        client.stopThen(session, std::move(finish));
    });
}

void ZRReportingClientServerInstance::destroyReportingSession(ReporterID reporterID, BooleanReply reply) {
    onServerQueue(Pace::mayBlock, [reporterID, reply = std::move(reply)](auto& client) mutable {
        client.performDestroy(reporterID, std::move(reply));
    });
}

void ZRReportingClientServerInstance::performDestroy(ReporterID reporterID, BooleanReply reply) {
    log::debug(ZRReportingServiceDelegateCategory(), "destroying session for reporter {}", reporterID);
    emitTracePoint(context_, TraceEvent::destroyReportingSession);
    if (reporterID == 0) {
        answer(reply, true);
        return;
    }
    const SessionRef session = findReportingSessionForID(reporterID, false);
    if (session == nullptr || !session->started()) {
        finishDestroy(reporterID, std::move(reply));
        return;
    }
    // From the first part on, the ID is its next holder's.
    sessionChanged(reporterID, nullptr);
    stopThen(session, [reporterID, reply = std::move(reply)](auto& client) mutable {
        client.finishDestroy(reporterID, std::move(reply));
    });
}

void ZRReportingClientServerInstance::finishDestroy(ReporterID reporterID, BooleanReply reply) {
    const auto entry = clientReportingSessionMap_.find(reporterID);
    if (entry != clientReportingSessionMap_.end()) {
        sessionChanged(reporterID, nullptr);
        letGoOf(entry);
    }
    log::standard(ZRReportingServiceDelegateCategory(), "destroying {}", reporterID);
    logReportingSessions();
    answer(reply, true);
}

void ZRReportingClientServerInstance::reporterID(ReporterID reporterID, DictionaryReply reply) {
    onServerQueue(Pace::quick, [reporterID, reply = std::move(reply)](auto& client) mutable {
        log::debug(ZRReportingServiceDelegateCategory(), "validating reporter {}", reporterID);
        const SessionRef session = client.findReportingSessionForID(reporterID, true);
        const Dictionary found{
            {ZRReporterProxyKeyReporterID, session != nullptr ? reporterID : ReporterID{0}},
            {ZRReporterProxyKeyServiceType,
             unsigned{session != nullptr ? session->serviceType() : AudioServiceTypeUnknown}},
        };
        log::standard(ZRReportingServiceDelegateCategory(), "validating reporter {}", reporterID);
        answer(reply, found);
    });
}

void ZRReportingClientServerInstance::getAllReporters(ReporterIDsReply reply) {
    if (!reply) {
        return; // there may be many of them
    }
    onServerQueue(Pace::quick, [reply = std::move(reply)](auto& client) mutable {
        std::vector<ReporterID> reporters;
        if (const Delegate delegate = client.delegate_.lock()) {
            for (const ClientRef& other : delegate->getAllClients()) {
                for (const auto& [reporterID, session] : other->clientReportingSessionMap()) {
                    reporters.push_back(reporterID);
                }
            }
        }
        answer(reply, reporters);
    });
}

void ZRReportingClientServerInstance::killService() {
    log::standard(ZRReportingServiceDelegateCategory(), "DESTROYING SERVICE");
    if (const Delegate delegate = delegate_.lock()) {
        delegate->exitProcess(kExitStatusKilled);
    }
}

void ZRReportingClientServerInstance::handleConnectionError() {
    onServerQueue(Pace::mayBlock, [](auto& client) { client.endConnection(); });
}

std::size_t ZRReportingClientServerInstance::abandon() {
    requests_->abandon();
    const auto isStarted = [](const auto& entry) { return entry.second->started(); };
    return static_cast<std::size_t>(std::ranges::count_if(clientReportingSessionMap_, isStarted));
}

void ZRReportingClientServerInstance::endAtOnce() {
    requests_->abandon();
    handleConnectionError();
}

/// Leaves the service, then stops the started sessions. No held start reply is answered.
void ZRReportingClientServerInstance::endConnection() {
    const Delegate delegate = delegate_.lock();
    if (delegate != nullptr && delegate->removeClient(*this)) {
        hasLeft_ = true;
        leaveSome();
    }
}

void ZRReportingClientServerInstance::leaveSome() {
    bool hasStopped = false;
    for (std::size_t i = 0; i != kSessionsLeftAtOnce && !hasStopped && !clientReportingSessionMap_.empty();
         ++i) {
        // Let go as soon as it is stopped, so that what it holds is not freed all at once in the end.
        const auto entry = clientReportingSessionMap_.begin();
        const SessionRef session = entry->second;
        hasStopped = session->started();
        bool isOver = !hasStopped;
        try {
            isOver = isOver || session->stopSome();
        } catch (const std::bad_alloc&) {
            log::ownError(ZRReportingServiceDelegateCategory(),
                          "no memory to stop the session of reporter {}", entry->first);
            session->giveUpStop();
            isOver = true;
        }
        if (isOver) {
            letGoOf(entry);
        }
    }
    if (!clientReportingSessionMap_.empty()) {
        afterTurnsOfOthers(Pace::mayBlock, [](auto& client) { client.leaveSome(); });
        return;
    }
    log::standard(ZRReportingServiceDelegateCategory(), "removing {} from the server client list",
                  processIdentifier());
    if (const Delegate delegate = delegate_.lock()) {
        delegate->clientHasLeft(shared_from_this());
    }
}

SessionRef ZRReportingClientServerInstance::findReportingSessionForID(ReporterID reporterID,
                                                                      bool acrossAllClients) const {
    const auto own = clientReportingSessionMap_.find(reporterID);
    SessionRef session;
    if (own != clientReportingSessionMap_.end()) {
        session = own->second;
    } else if (const Delegate delegate = acrossAllClients ? delegate_.lock() : nullptr) {
        session = delegate->findReportingSessionForID(reporterID);
    }
    if (session != nullptr) {
        requests_->chargeTo(session->processorTime());
    }
    return session;
}

SessionRef ZRReportingClientServerInstance::makeSession(ReporterID reporterID) const {
    SessionRef session = ZRReportingSession::initWithID(context_, reporterID, {processIdentifier()});
    session->setClientProcessName(clientProcessName());
    session->setUser(user());
    return session;
}

void ZRReportingClientServerInstance::storeSession(ReporterID reporterID, SessionRef session) {
    SessionRef& place = clientReportingSessionMap_[reporterID];
    SessionRef replaced = std::exchange(place, std::move(session));
    sessionChanged(reporterID, place);
    UserAccount* const all = account();
    if (replaced != nullptr) {
        if (all != nullptr) {
            all->changeConfiguration(replaced->configurationBytes(), place->configurationBytes());
        }
        letGoInParts(context_, std::move(replaced));
    } else if (all != nullptr) {
        all->addSession(place->configurationBytes());
    }
}

void ZRReportingClientServerInstance::letGoOf(SessionMap::iterator entry) {
    SessionRef session = std::move(entry->second);
    clientReportingSessionMap_.erase(entry);
    if (UserAccount* const all = account()) {
        all->removeSession(session->configurationBytes());
    }
    letGoInParts(context_, std::move(session));
}

void ZRReportingClientServerInstance::sessionChanged(ReporterID reporterID, const SessionRef& session) const {
    if (const Delegate delegate = presentDelegate()) {
        delegate->sessionChanged(*this, reporterID, session);
    }
}

void ZRReportingClientServerInstance::logReportingSessions() const {
    if (const Delegate delegate = delegate_.lock()) {
        delegate->logReportingSessions();
    }
}

bool ZRReportingClientServerInstance::isReportingEnabled() const noexcept {
    const Delegate delegate = delegate_.lock();
    return delegate != nullptr && delegate->isReportingEnabled();
}

} // namespace tamblo
