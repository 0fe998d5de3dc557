#include "service/ZRReportingService.h"

#include "base/WhileAlive.h"
#include "platform/Counters.h"
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

/// How long the requests that have been read may take when the service ends, and then what is left of stops.
constexpr std::chrono::seconds kPatienceWithRequests{5};
constexpr std::chrono::seconds kPatienceWithStops{3};
/// A message to all started sessions looks for so many of them at a time.
constexpr std::size_t kSessionsFoundAtOnce = 32;

/// The process name of the command-line client, whose connections are no audio component's.
constexpr std::string_view kToolName = "tambloctl";

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
    if (*knownName == kToolName) {
        return; // looking at what is reported should not add to it
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
    // Read at once, as a process may be gone by the time that the queue gets to it; from a file of the
    // kernel's, which is memory. Another process may have got its number while it was read.
    auto name = context_.platform().processInformation->ProcessNameForPid(processIdentifier);
    if (!connection.isPeerThere()) {
        name.reset();
    }
    ZRReportingClientServerInstance::Acceptance acceptance{connection.peer(), ++lastAcceptanceOrder_,
                                                           context_.platform().clock->now(), std::move(name)};
    const auto client = std::make_shared<ZRReportingClientServerInstance>(context_, std::move(acceptance),
                                                                          connection.requestQueue(), self_);
    connection.setExportedObject(client);
    connection.requestQueue()->post(
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

std::vector<ClientRef>::iterator ZRReportingService::placeOf(const ZRReportingClientServerInstance& client) {
    return std::lower_bound(
        clients_.begin(), clients_.end(), client.acceptanceOrder(),
        [](const ClientRef& other, std::uint64_t order) { return other->acceptanceOrder() < order; });
}

void ZRReportingService::addClient(const ClientRef& client) {
    clients_.insert(placeOf(*client), client);
    if (isShuttingDown_) {
        client->handleConnectionError();
    }
}

bool ZRReportingService::removeClient(ZRReportingClientServerInstance& client) {
    const auto place = placeOf(client);
    if (place == clients_.end() || place->get() != &client) {
        return false;
    }
    leavingClients_.emplace(client.acceptanceOrder(), *place);
    clients_.erase(place);
    for (const auto& [reporterID, session] : client.clientReportingSessionMap()) {
        sessionChanged(client, reporterID, nullptr);
    }
    return true;
}

void ZRReportingService::clientHasLeft(const ClientRef& client) {
    leavingClients_.erase(client->acceptanceOrder());
    if (isShuttingDown_) {
        // Its connection may end when nothing is reported any more.
        reportClientUptime(context_, client, client->processIdentifier(), context_.platform().clock->now());
        completeShutdown();
    }
}

void ZRReportingService::sessionChanged(const ZRReportingClientServerInstance& client, ReporterID reporterID,
                                        const SessionRef& session) {
    sessions_.set(reporterID, {client.acceptanceOrder(), client.processIdentifier(), session});
}

std::vector<SessionRef> ZRReportingService::getAllActiveReportingSessions() {
    logSessionsOfClients();
    std::vector<SessionRef> sessions;
    (void)sessions_.findStarted(std::nullopt, sessions_.startedCount(), sessions);
    return sessions;
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
        if (!log::standard(ZRReportingServiceDelegateCategory(), "sessions for client {} : {}",
                           client->processIdentifier(), SessionList{shown, all.size()})) {
            return;
        }
    }
}

void ZRReportingService::logReportingSessions() {
    if (!ZRReportingServiceDelegateCategory().isOn(LogLevel::standard)) {
        return;
    }
    // A client may have ten thousand of them and start one more: what the line does not show is not gathered.
    logSessionsOfClients();
    std::vector<SessionRef> shown;
    (void)sessions_.findStarted(std::nullopt, SessionList::kMost, shown);
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
    auto walk = reporterIDs.empty() ? findFirstStarted(found) : std::nullopt;
    while (walk) {
        walk = findNextStarted(*walk, found);
    }
}

std::optional<StartedWalk> ZRReportingService::findFirstStarted(std::vector<SessionRef>& found) {
    logSessionsOfClients();
    logReportingSessions();
    if (sessions_.startedCount() == 0) {
        found.push_back(singleMessages_->retrieve());
        return std::nullopt;
    }
    return sessions_.findStarted(std::nullopt, kSessionsFoundAtOnce, found);
}

std::optional<StartedWalk> ZRReportingService::findNextStarted(const StartedWalk& walk,
                                                               std::vector<SessionRef>& found) {
    return sessions_.findStarted(walk, kSessionsFoundAtOnce, found);
}

void ZRReportingService::shutDown(UniqueFunction<void()> completed) {
    context_.serverQueue().post(whileAlive(std::weak_ptr(self_),
                                           [completed = std::move(completed)](auto& service) mutable {
                                               service.endAllClients(std::move(completed));
                                           }),
                                Pace::mayBlock);
}

void ZRReportingService::endAllClients(UniqueFunction<void()> completed) {
    isShuttingDown_ = true;
    shutdownCompleted_ = std::move(completed);
    callInShutdown(kPatienceWithRequests, &ZRReportingService::dropRequests);
    for (const ClientRef& client : clients_) {
        client->handleConnectionError();
    }
    completeShutdown();
}

void ZRReportingService::callInShutdown(std::chrono::milliseconds delay,
                                        void (ZRReportingService::*function)()) {
    shutdownPatience_ = context_.platform().workQueues->callAfter(
        delay, [&queue = context_.serverQueue(), function, self = std::weak_ptr(self_)] {
            queue.post(whileAlive(self, [function](auto& service) {
                if (service.shutdownCompleted_) {
                    (service.*function)();
                }
            }));
        });
}

void ZRReportingService::dropRequests() {
    for (const ClientRef& client : clients_) {
        client->endAtOnce();
    }
    callInShutdown(kPatienceWithStops, &ZRReportingService::dropClients);
}

void ZRReportingService::dropClients() {
    for (const ClientRef& client : std::exchange(clients_, {})) {
        leavingClients_.emplace(client->acceptanceOrder(), client);
    }
    std::size_t sessions = 0;
    for (const auto& [order, client] : leavingClients_) {
        sessions += client->abandon();
        reportClientUptime(context_, client, client->processIdentifier(), context_.platform().clock->now());
    }
    counters::add(counters::Counter::stopsLost, sessions);
    log::ownError(ZRReportingServiceDelegateCategory(),
                  "{} sessions were not stopped in time, and go without", sessions);
    leavingClients_.clear();
    completeShutdown();
}

void ZRReportingService::completeShutdown() {
    if (!clients_.empty() || !leavingClients_.empty()) {
        return;
    }
    shutdownPatience_.reset();
    singleMessages_->stop();
    // A client whose requests were read before the end, and are carried out after it, comes here again.
    if (auto completed = std::exchange(shutdownCompleted_, {})) {
        completed();
    }
}

} // namespace tamblo
