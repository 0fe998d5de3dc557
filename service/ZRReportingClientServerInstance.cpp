#include "service/ZRReportingClientServerInstance.h"

#include "session/ZRReportingSession.h"
#include "util/AudioEvents.h"
#include "util/Log.h"
#include "util/TraceEvents.h"

#include <utility>

namespace tamblo {

namespace {

constexpr std::string_view ZRReporterProxyKeyReporterID = "reporterID";
constexpr std::string_view ZRReporterProxyKeyServiceType = "serviceType";
constexpr std::string_view kErrorDomain = "com.vandra.audio.reporting";
constexpr std::int64_t kReportingDisabled = 1;
constexpr int kExitStatusKilled = 2;
/// More retained messages than this take a moment to free.
constexpr std::size_t kManyMessages = 10'000;

template <typename Reply, typename... Result> void answer(Reply& reply, const Result&... result) {
    if (reply) {
        reply(nullptr, result...);
    }
}

} // namespace

ZRReportingClientServerInstance::ZRReportingClientServerInstance(
    Context& context, pid_t processIdentifier, std::weak_ptr<ZRReportingServiceDelegateProtocol> delegate)
    : context_(context), processIdentifier_(processIdentifier), delegate_(std::move(delegate)) {
    log::standard(ZRReportingServiceDelegateCategory(), "new client with pid {}", processIdentifier);
}

ZRReportingClientServerInstance::~ZRReportingClientServerInstance() {
    log::standard(ZRReportingServiceDelegateCategory(), "dealloc {} from the server client list",
                  processIdentifier_);
}

template <typename Piece> void ZRReportingClientServerInstance::onServerQueue(Pace pace, Piece piece) {
    auto work = [client = shared_from_this(), piece = std::move(piece)]() mutable { piece(*client); };
    context_.serverQueue().post(std::move(work), pace);
}

void ZRReportingClientServerInstance::createReportingSession(ReporterID reporterID, BooleanReply reply) {
    onServerQueue(Pace::quick, [reporterID, reply = std::move(reply)](auto& client) mutable {
        log::debug(ZRReportingServiceDelegateCategory(), "creating session for reporter {}", reporterID);
        emitTracePoint(client.context_, TraceEvent::createReportingSession);
        client.storeSession(reporterID, client.makeSession(reporterID));
        log::standard(ZRReportingServiceDelegateCategory(), "session created for reporter {}", reporterID);
        answer(reply, true);
    });
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
        log::debug(ZRReportingServiceDelegateCategory(), "setting configuration");
        if (const SessionRef session = client.findReportingSessionForID(reporterID, false)) {
            session->updateConfigurationWithContentsOfConfiguration(configuration);
        }
        answer(reply, true);
    });
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
        return;
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
        if (reply) {
            const ReplyError error{std::string(kErrorDomain), kReportingDisabled};
            reply(&error);
        }
        return;
    }
    delegate->findReportingSessionsForIDs(reporterIDs, recipients_);
    const auto sendTo = [category, type](const SessionRef& session, Dictionary payload) {
        session->sendMessage(std::make_shared<ZRReportingSessionMessage>(std::move(payload), category, type));
    };
    // The last one is given the payload itself, which spares it a copy when it is normalised.
    for (std::size_t i = 1; i < recipients_.size(); ++i) {
        sendTo(recipients_[i - 1], message);
    }
    if (!recipients_.empty()) {
        sendTo(recipients_.back(), std::move(message));
    }
    recipients_.clear();
    answer(reply);
}

void ZRReportingClientServerInstance::stopReportingSessionForID(ReporterID reporterID, BooleanReply reply) {
    onServerQueue(Pace::mayBlock, [reporterID, reply = std::move(reply)](auto& client) mutable {
        client.performStop(reporterID);
        answer(reply, true);
    });
}

void ZRReportingClientServerInstance::performStop(ReporterID reporterID) {
    log::debug(ZRReportingServiceDelegateCategory(), "stopping session for reporter {}", reporterID);
    emitTracePoint(context_, TraceEvent::stopReportingSession);
    if (reporterID == 0) {
        return;
    }
    const SessionRef session = findReportingSessionForID(reporterID, false);
    if (session != nullptr && session->started()) {
        session->stop();
        sessionChanged(reporterID, session);
        BooleanReply held = session->takeTransactionCompleteBlock();
        answer(held, true);
        logReportingSessions();
    } else {
        log::debug(ZRReportingServiceDelegateCategory(),
                   "Stop called, but session==nil or session.started==false. reporterID={} session={} "
                   "session.started={}",
                   reporterID, session, session != nullptr && session->started());
    }
    log::standard(ZRReportingServiceDelegateCategory(), "stopping {}", reporterID);
}

void ZRReportingClientServerInstance::destroyReportingSession(ReporterID reporterID, BooleanReply reply) {
    onServerQueue(Pace::mayBlock, [reporterID, reply = std::move(reply)](auto& client) mutable {
        client.performDestroy(reporterID);
        answer(reply, true);
    });
}

void ZRReportingClientServerInstance::performDestroy(ReporterID reporterID) {
    log::debug(ZRReportingServiceDelegateCategory(), "destroying session for reporter {}", reporterID);
    emitTracePoint(context_, TraceEvent::destroyReportingSession);
    if (reporterID == 0) {
        return;
    }
    if (const SessionRef session = findReportingSessionForID(reporterID, false)) {
        if (session->started()) {
            session->stop();
        }
        clientReportingSessionMap_.erase(reporterID);
        sessionChanged(reporterID, nullptr);
    }
    log::standard(ZRReportingServiceDelegateCategory(), "destroying {}", reporterID);
    logReportingSessions();
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

void ZRReportingClientServerInstance::endConnection() {
    if (const Delegate delegate = delegate_.lock()) {
        delegate->removeClient(*this);
    }
}

SessionRef ZRReportingClientServerInstance::findReportingSessionForID(ReporterID reporterID,
                                                                      bool acrossAllClients) const {
    const auto own = clientReportingSessionMap_.find(reporterID);
    if (own != clientReportingSessionMap_.end()) {
        return own->second;
    }
    const Delegate delegate = acrossAllClients ? delegate_.lock() : nullptr;
    return delegate != nullptr ? delegate->findReportingSessionForID(reporterID) : nullptr;
}

SessionRef ZRReportingClientServerInstance::makeSession(ReporterID reporterID) const {
    SessionRef session = ZRReportingSession::initWithID(context_, reporterID, {processIdentifier_});
    session->setClientProcessName(clientProcessName_);
    return session;
}

void ZRReportingClientServerInstance::storeSession(ReporterID reporterID, SessionRef session) {
    SessionRef& place = clientReportingSessionMap_[reporterID];
    SessionRef replaced = std::exchange(place, std::move(session));
    sessionChanged(reporterID, place);
    if (replaced != nullptr && replaced->messages().size() > kManyMessages) {
        // Freed as a piece of work of its own, which may take its time.
        context_.serverQueue().post([session = std::move(replaced)] {}, Pace::mayBlock);
    }
}

void ZRReportingClientServerInstance::sessionChanged(ReporterID reporterID, const SessionRef& session) const {
    if (const Delegate delegate = delegate_.lock()) {
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
