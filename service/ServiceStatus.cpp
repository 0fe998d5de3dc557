#include "service/ServiceStatus.h"

#include "base/Json.h"
#include "base/Utf8.h"
#include "base/WhileAlive.h"
#include "service/ZRReportingClientServerInstance.h"
#include "session/ZRReportingSession.h"
#include "util/ReportingUtilities.h"

#include <algorithm>
#include <limits>
#include <map>
#include <optional>
#include <string>
#include <utility>

namespace tamblo {

namespace {

/// Clients and sessions of a slice.
constexpr std::size_t kRowsOfSlice = 250;
/// Bytes of an application's name.
constexpr std::size_t kMostBytesOfName = 256;

std::string applicationOf(const ZRReportingSession& session) {
    const Value name = ZRReportingUtilityRetrieveAppName(session.configuration());
    if (name.isString()) {
        return std::string(cutUtf8(name.stringValue(), kMostBytesOfName));
    }
    return name.heldBytes() <= kMostBytesOfName ? jsonText(name) : "(...)";
}

ClientRow rowOf(const ZRReportingClientServerInstance& client) {
    const RequestTally& tally = client.tally();
    return {.order = client.acceptanceOrder(),
            .identity = client.identity(),
            .processName = client.clientProcessName(),
            .connected = client.clientStartDate(),
            .requests = tally.requests(),
            .bytes = tally.bytes(),
            .messages = tally.messages(),
            .time = tally.time(),
            .sessions = client.clientReportingSessionMap().size()};
}

std::optional<std::chrono::nanoseconds> lengthOf(const ZRReportingSession& session, WallTime now) {
    const std::optional<WallTime> start = session.startTime();
    return start ? std::optional(session.stopTime().value_or(now) - *start) : std::nullopt;
}

SessionRow rowOf(const ZRReportingSession& session, const ZRReportingClientServerInstance* client,
                 WallTime now) {
    return {.clientOrder = client != nullptr ? client->acceptanceOrder() : 0,
            .owner = client != nullptr ? client->identity() : ClientIdentity{},
            .processName = session.clientProcessName(),
            .reporterID = session.reporterID(),
            .serviceType = session.serviceType(),
            .serviceName = session.serviceName(),
            .application = applicationOf(session),
            .isStarted = session.started(),
            .isStopping = session.isStopping(),
            .start = session.startTime(),
            .length = lengthOf(session, now),
            .messages = static_cast<std::uint64_t>(session.totalMessageCount()),
            .bytes = session.messageBytes(),
            .recorded = session.acceptedMessageCount(),
            .dropped = session.droppedMessageCount(),
            .time = *session.processorTime(),
            .retainedBytes = session.retainedBytes()};
}

SessionDetail detailOf(const ZRReportingSession& session, const ZRReportingClientServerInstance* client,
                       WallTime now) {
    return {.row = rowOf(session, client, now),
            .configuration = session.configuration(),
            .previousValues = session.previousValues(),
            .workers = session.workerNames()};
}

} // namespace

/// A walk over all clients and their sessions, which may be interrupted behind any of them.
struct ServiceStatus::Walk {
    using OnClient = UniqueFunction<void(const ZRReportingClientServerInstance&)>;
    using OnSession = UniqueFunction<void(const ZRReportingClientServerInstance*, const ZRReportingSession&)>;

    OnClient onClient;
    OnSession onSession; ///< the single-message session's client is null
    UniqueFunction<void()> done;
    std::uint64_t client = 0; ///< whose sessions come next
    std::optional<ReporterID> last{};
};

ServiceStatus::ServiceStatus(Context& context, const ZRReportingService& service)
    : context_(context), service_(service), self_(this, [](ServiceStatus*) {}) {}

ServiceStatus::~ServiceStatus() {
    self_.reset();
}

template <typename Piece> void ServiceStatus::onServerQueue(Piece piece) {
    context_.serverQueue().post(whileAlive(std::weak_ptr(self_), std::move(piece)));
}

void ServiceStatus::walkSome(std::unique_ptr<Walk> walk) {
    onServerQueue([walk = std::move(walk)](ServiceStatus& status) mutable {
        if (status.walkSlice(*walk)) {
            walk->done();
        } else {
            status.walkSome(std::move(walk));
        }
    });
}

bool ServiceStatus::walkSlice(Walk& walk) const {
    const std::vector<ClientRef>& clients = service_.getAllClients();
    auto client = std::ranges::lower_bound(clients, walk.client, {},
                                           [](const ClientRef& other) { return other->acceptanceOrder(); });
    std::size_t rows = 0;
    for (; client != clients.end(); ++client) {
        if ((*client)->acceptanceOrder() != walk.client) {
            if (rows == kRowsOfSlice) {
                return false;
            }
            walk.client = (*client)->acceptanceOrder();
            walk.last.reset();
            walk.onClient(**client);
            ++rows;
        }
        const auto& sessions = (*client)->clientReportingSessionMap();
        for (auto entry = walk.last ? sessions.upper_bound(*walk.last) : sessions.begin();
             entry != sessions.end(); ++entry) {
            if (rows == kRowsOfSlice) {
                return false;
            }
            walk.last = entry->first;
            walk.onSession(client->get(), *entry->second);
            ++rows;
        }
        walk.last = std::numeric_limits<ReporterID>::max();
    }
    if (const SessionRef single = service_.singleMessageSession()) {
        walk.onSession(nullptr, *single);
    }
    return true;
}

void ServiceStatus::clients(Reply<std::vector<ClientRow>> reply) {
    auto rows = std::make_shared<std::vector<ClientRow>>();
    walkSome(std::make_unique<Walk>(
        Walk{.onClient = [rows](const auto& client) { rows->push_back(rowOf(client)); },
             .onSession =
                 [rows](const auto* client, const ZRReportingSession& session) {
                     if (client != nullptr) {
                         rows->back().startedSessions += session.started() ? 1 : 0;
                         rows->back().retainedBytes += session.retainedBytes();
                     }
                 },
             .done = [rows, reply = std::move(reply)]() mutable { reply(std::move(*rows)); }}));
}

void ServiceStatus::sessions(Reply<std::vector<SessionRow>> reply) {
    auto rows = std::make_shared<std::vector<SessionRow>>();
    // Room for those that there are now: to move thousands of rows would take longer than a slice.
    rows->reserve(context_.platform().activity->sessions + 1);
    walkSome(std::make_unique<Walk>(
        Walk{.onClient = [](const auto&) {},
             .onSession =
                 [rows, &clock = *context_.platform().clock](const auto* client,
                                                             const ZRReportingSession& session) {
                     rows->push_back(rowOf(session, client, clock.now()));
                 },
             .done = [rows, reply = std::move(reply)]() mutable { reply(std::move(*rows)); }}));
}

void ServiceStatus::session(ReporterID reporterID, Reply<std::vector<SessionDetail>> reply) {
    auto found = std::make_shared<std::vector<SessionDetail>>();
    const Clock& clock = *context_.platform().clock;
    walkSome(std::make_unique<Walk>(
        Walk{.onClient =
                 [found, reporterID, &clock](const ZRReportingClientServerInstance& client) {
                     const auto& sessions = client.clientReportingSessionMap();
                     const auto entry = sessions.find(reporterID);
                     if (entry != sessions.end()) {
                         found->push_back(detailOf(*entry->second, &client, clock.now()));
                     }
                 },
             .onSession =
                 [found, reporterID, &clock](const auto* client, const ZRReportingSession& session) {
                     if (client == nullptr && session.reporterID() == reporterID) {
                         found->push_back(detailOf(session, nullptr, clock.now()));
                     }
                 },
             .done = [found, reply = std::move(reply)]() mutable { reply(std::move(*found)); }}));
}

void ServiceStatus::users(Reply<std::vector<UserRow>> reply) {
    onServerQueue([reply = std::move(reply)](ServiceStatus& status) mutable {
        std::map<uid_t, UserRow> rows;
        for (const auto& [user, account] : status.service_.accounts()) {
            rows[user].sessions = account.sessions();
            rows[user].configurationBytes = account.configurationBytes();
        }
        status.context_.shared<RetainedMessages>(status.context_)
            .forEachUser([&rows](uid_t user, std::size_t bytes) { rows[user].retainedBytes = bytes; });
        std::vector<UserRow> all;
        for (auto& [user, row] : rows) {
            row.user = user;
            all.push_back(row);
        }
        reply(std::move(all));
    });
}

} // namespace tamblo
