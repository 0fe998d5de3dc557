#include "service/ZRReportingService.h"

#include "base/WhileAlive.h"
#include "service/ZRReportingClientServerInstance.h"
#include "session/ZRReportingSession.h"
#include "system/ZRReportingSystemMonitor.h"
#include "util/Log.h"

#include <algorithm>
#include <chrono>
#include <optional>
#include <string>
#include <utility>

namespace tamblo {

namespace {

/// Seconds from the start to the end, either way round; −1 without a start.
Value uptimeBetween(const std::optional<WallTime>& start, WallTime end, pid_t processIdentifier,
                    const std::string& name) {
    if (!start) {
        log::standard(ZRReportingServiceDelegateCategory(),
                      "clientStartDate is nil. clientpid={} clientprocessname={}", processIdentifier, name);
        return -1;
    }
    if (*start > end) {
        // The text says "past" for a start in the future; those who search the log know it so.
        log::standard(ZRReportingServiceDelegateCategory(),
                      "clientStartDate is in the past. clientpid={} clientprocessname={}", processIdentifier,
                      name);
    }
    return std::chrono::duration<double>(std::chrono::abs(end - *start)).count();
}

/// Reports how long a client was connected, once its connection has ended for good, which was at `end`;
/// `client` is null when it is gone already. Once for each client: its connection may end while the service
/// shuts down. On the reporting server queue.
void reportClientUptime(const Context& context, const ClientRef& client, pid_t processIdentifier,
                        WallTime end) {
    if (client != nullptr && !client->claimUptimeReport()) {
        return;
    }
    const std::optional<std::string> knownName =
        client != nullptr ? client->clientProcessName() : std::nullopt;
    const std::string name = knownName.value_or("unknown");
    const std::optional<WallTime> start = client != nullptr ? client->clientStartDate() : std::nullopt;
    const Value uptime = uptimeBetween(start, end, processIdentifier, name);
    log::standard(ZRReportingServiceDelegateCategory(),
                  "invalidationHandler: connection exited process={} uptime_sec={}", name,
                  uptime.integerValue());
    if (!knownName) {
        log::standard(ZRReportingServiceDelegateCategory(), "clientProcessName is nil. clientpid={}",
                      processIdentifier);
        return;
    }
    context.platform().analyticsEvents->sendEventLazy("com.vandra.tamblo.zrreportingclientuptime", [&] {
        return Dictionary{{"processName", name}, {"seconds", uptime}};
    });
}

} // namespace

ZRReportingService::ZRReportingService(Context& context, ExitProcess exit)
    : context_(context),
      exitProcess_(exit),
      singleMessages_(std::make_shared<SingleMessageSessionKeeper>(context)),
      self_(this, [](ZRReportingService*) {}) {
    ZRReportingSystemMonitor::initializeWithQueue(context, context.serverQueue());
}

ZRReportingService::~ZRReportingService() {
    log::standard(ZRReportingClientCategory(), "destroying service");
    self_.reset();
}

bool ZRReportingService::shouldAcceptNewConnection(ClientConnection& connection) {
    const pid_t processIdentifier = connection.peerProcessIdentifier();
    if (ZRReportingServiceDelegateCategory().isOn(LogLevel::standard)) {
        log::standard(ZRReportingServiceDelegateCategory(), "newConnection: {}", connection.description());
    }
    const auto client = std::make_shared<ZRReportingClientServerInstance>(context_, processIdentifier, self_);
    connection.setExportedObject(client);
    // The process's name is read from a file of the kernel's, which is memory.
    context_.serverQueue().post(
        whileAlive(std::weak_ptr(self_), [client](auto& service) { service.addClient(client); }));
    setHandlers(connection, client);
    connection.resume();
    return true;
}

void ZRReportingService::setHandlers(ClientConnection& connection, const ClientRef& client) {
    const std::weak_ptr<ZRReportingClientServerInstance> weakClient = client;
    connection.setInterruptionHandler([weakClient] {
        log::standard(ZRReportingServiceDelegateCategory(), "interruptionHandler: connection exited");
        if (const ClientRef held = weakClient.lock()) {
            held->handleConnectionError();
        }
    });
    connection.setInvalidationHandler(
        [&context = context_, weakClient, processIdentifier = client->processIdentifier()] {
            const ClientRef held = weakClient.lock();
            if (held != nullptr) {
                held->handleConnectionError();
            }
            // The client's fields are the queue's to read; it is kept until they are. What the queue has to
            // do before is none of the client's time.
            context.serverQueue().post(
                [&context, held, processIdentifier, end = context.platform().clock->now()] {
                    reportClientUptime(context, held, processIdentifier, end);
                });
        });
}

void ZRReportingService::addClient(const ClientRef& client) {
    client->setAcceptanceOrder(++lastAcceptanceOrder_);
    clients_.push_back(client);
    client->setClientStartDate(context_.platform().clock->now());
    client->setClientProcessName(
        context_.platform().processInformation->ProcessNameForPid(client->processIdentifier()));
}

void ZRReportingService::removeClient(ZRReportingClientServerInstance& client) {
    const auto place = std::lower_bound(
        clients_.begin(), clients_.end(), client.acceptanceOrder(),
        [](const ClientRef& other, std::uint64_t order) { return other->acceptanceOrder() < order; });
    if (place == clients_.end() || place->get() != &client) {
        return;
    }
    ClientRef removed = std::move(*place);
    clients_.erase(place);
    auto sessions = removed->takeSessions();
    for (const auto& [reporterID, session] : sessions) {
        sessionChanged(client, reporterID, nullptr);
    }
    removed->setAcceptanceOrder(0);
    leaving_.add(std::move(removed), std::move(sessions));
    queueFurtherStops();
}

void ZRReportingService::queueFurtherStops() {
    if (leaving_.isEmpty() || std::exchange(areStopsQueued_, true)) {
        return;
    }
    context_.serverQueue().post(whileAlive(std::weak_ptr(self_),
                                           [](auto& service) {
                                               service.leaving_.stopSome();
                                               service.areStopsQueued_ = false;
                                               service.queueFurtherStops();
                                           }),
                                Pace::mayBlock);
}

void ZRReportingService::sessionChanged(const ZRReportingClientServerInstance& client, ReporterID reporterID,
                                        const SessionRef& session) {
    // A client that has left, or has yet to come, is none whose sessions are found.
    if (client.acceptanceOrder() != 0) {
        sessions_.set(reporterID, {client.acceptanceOrder(), client.processIdentifier(), session});
    }
}

std::vector<SessionRef> ZRReportingService::getAllActiveReportingSessions() {
    logSessionsOfClients();
    return sessions_.startedSessions();
}

void ZRReportingService::logSessionsOfClients() const {
    if (!ZRReportingServiceDelegateCategory().isOn(LogLevel::standard)) {
        return;
    }
    std::vector<SessionRef> shown;
    for (const ClientRef& client : clients_) {
        const auto& all = client->clientReportingSessionMap();
        shown.clear();
        for (auto entry = all.begin(); entry != all.end() && shown.size() != SessionList::kMost; ++entry) {
            shown.push_back(entry->second);
        }
        log::standard(ZRReportingServiceDelegateCategory(), "sessions for client {} : {}",
                      client->processIdentifier(), SessionList{shown, all.size()});
    }
}

void ZRReportingService::logReportingSessions() {
    if (!ZRReportingServiceDelegateCategory().isOn(LogLevel::standard)) {
        return;
    }
    // A client may have ten thousand of them and start one more: what the line does not show is not gathered.
    logSessionsOfClients();
    const std::vector<SessionRef> shown = sessions_.startedSessions(SessionList::kMost);
    const std::size_t count = sessions_.startedCount();
    log::standard(ZRReportingServiceDelegateCategory(), "{} active reporting session(s) {}", count,
                  SessionList{shown, count});
}

SessionRef ZRReportingService::findReportingSessionForID(ReporterID reporterID) {
    if (reporterID == 0 || !reportingEnabled_) {
        return nullptr;
    }
    const SessionRegistry::Entry* found = sessions_.find(reporterID);
    if (found == nullptr) {
        log::error(ZRReportingServiceDelegateCategory(), "failed to find reporting session {}", reporterID);
        return nullptr;
    }
    log::info(ZRReportingServiceDelegateCategory(), "found reporting session {} for client {}", reporterID,
              found->clientProcessIdentifier);
    return found->session;
}

void ZRReportingService::findReportingSessionsForIDs(std::span<const ReporterID> reporterIDs,
                                                     std::vector<SessionRef>& found) {
    for (const ReporterID reporterID : reporterIDs) {
        if (SessionRef session = findReportingSessionForID(reporterID)) {
            found.push_back(std::move(session));
        }
    }
    if (!reporterIDs.empty()) {
        return;
    }
    std::vector<SessionRef> active = getAllActiveReportingSessions();
    logReportingSessions();
    if (active.empty()) {
        found.push_back(singleMessages_->retrieve());
    } else {
        found.insert(found.end(), active.begin(), active.end());
    }
}

void ZRReportingService::shutDown(UniqueFunction<void()> completed) {
    context_.serverQueue().post(
        [service = std::weak_ptr(self_), completed = std::move(completed)]() mutable {
            if (const auto held = service.lock()) {
                held->endAllClients();
                held->singleMessages_->stop();
            }
            completed();
        },
        Pace::mayBlock);
}

void ZRReportingService::endAllClients() {
    leaving_.stopAll();
    // Each leaves the list as it ends.
    const std::vector<ClientRef> remaining = clients_;
    for (const ClientRef& client : remaining) {
        const WallTime end = context_.platform().clock->now();
        client->endConnection();
        leaving_.stopAll();
        reportClientUptime(context_, client, client->processIdentifier(), end);
    }
}

} // namespace tamblo
