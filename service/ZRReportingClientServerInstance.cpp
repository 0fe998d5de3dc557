#include "service/ZRReportingClientServerInstance.h"

#include "service/Answers.h"
#include "session/ZRReportingSession.h"
#include "util/AudioEvents.h"
#include "util/Log.h"
#include "util/MessageKeys.h"
#include "util/TraceEvents.h"

#include <algorithm>
#include <utility>

namespace tamblo {

namespace {

constexpr std::string_view ZRReporterProxyKeyReporterID = "reporterID";
constexpr std::string_view ZRReporterProxyKeyServiceType = "serviceType";
constexpr int kExitStatusKilled = 2;

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

} // namespace tamblo
