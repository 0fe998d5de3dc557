#pragma once

#include "platform/ZRReportingServiceProtocol.h"
#include "service/UserAccounts.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <utility>
#include <vector>

namespace tamblo {

class ZRReportingClientServerInstance;
class ZRReportingSession;

using SessionRef = std::shared_ptr<ZRReportingSession>;
using ClientRef = std::shared_ptr<ZRReportingClientServerInstance>;

/// Where a walk over the started sessions is, client by client. Those that are started after its beginning
/// are not its own, those that are stopped before it comes to them no more.
struct StartedWalk {
    std::pair<std::uint64_t, ReporterID> last; ///< order of acceptance of the client, and ID
    std::uint64_t newest = 0;                  ///< start among those at its beginning
};

/// What a client instance needs of the service. On the reporting server queue, except the two that say
/// otherwise.
class ZRReportingServiceDelegateProtocol {
public:
    virtual ~ZRReportingServiceDelegateProtocol() = default;

    /// All accepted clients, in order of acceptance.
    [[nodiscard]] virtual const std::vector<ClientRef>& getAllClients() const = 0;
    /// Any thread.
    [[nodiscard]] virtual bool isReportingEnabled() const noexcept = 0;
    /// The started sessions of all clients, client by client.
    [[nodiscard]] virtual std::vector<SessionRef> getAllActiveReportingSessions() = 0;
    /// The session of the first client that has one of this ID, or null. ID 0 names none.
    [[nodiscard]] virtual SessionRef findReportingSessionForID(ReporterID reporterID) = 0;
    /// Appends the sessions of these IDs, in their order. Without any ID: every started session, or else the
    /// single-message session.
    virtual void findReportingSessionsForIDs(std::span<const ReporterID> reporterIDs,
                                             std::vector<SessionRef>& found) = 0;
    /// The same without any ID, for whoever goes on to the next sessions later: appends the first ones, some
    /// dozens, and returns where they end; nothing when these are all.
    [[nodiscard]] virtual std::optional<StartedWalk> findFirstStarted(std::vector<SessionRef>& found) = 0;
    [[nodiscard]] virtual std::optional<StartedWalk> findNextStarted(const StartedWalk& walk,
                                                                     std::vector<SessionRef>& found) = 0;
    /// From here on nobody finds the client or a session of its. False when it is not among the accepted
    /// ones.
    virtual bool removeClient(ZRReportingClientServerInstance& client) = 0;
    /// To be told once the sessions of a removed client are stopped and let go.
    virtual void clientHasLeft(const ClientRef& client) = 0;
    /// What the user's clients hold together; they keep it up to date. Stays where it is.
    [[nodiscard]] virtual UserAccount& accountOf(uid_t user) = 0;
    /// Writes each client's sessions, and the started ones of all, to the log.
    virtual void logReportingSessions() = 0;

    /// To be told after every change of what a client holds under an ID, its sessions' starts and stops
    /// included; null when it holds nothing any more.
    virtual void sessionChanged(const ZRReportingClientServerInstance& client, ReporterID reporterID,
                                const SessionRef& session) = 0;
    /// Ends the process at once. Any thread.
    virtual void exitProcess(int status) = 0;
};

} // namespace tamblo
