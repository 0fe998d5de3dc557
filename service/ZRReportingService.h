#pragma once

#include "base/UniqueFunction.h"
#include "platform/ConnectionService.h"
#include "platform/WorkQueue.h"
#include "service/SessionRegistry.h"
#include "service/SingleMessageSessionKeeper.h"
#include "service/ZRReportingServiceDelegateProtocol.h"
#include "util/Context.h"

#include <atomic>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <span>
#include <vector>

namespace tamblo {

/// The one service: accepts every client, keeps them in order of acceptance, finds sessions across them, and
/// owns the single-message session.
///
/// Made by the entry point after the context, and made the delegate of the listener. Acceptance and the
/// connections' handlers come on other threads and only queue work; everything else happens on the reporting
/// server queue. Destroy it only when that queue is at rest. The clients' requests are not here: they are
/// operations of `ZRReportingClientServerInstance`, one for each connection.
class ZRReportingService final : public ListenerDelegate, public ZRReportingServiceDelegateProtocol {
public:
    using ExitProcess = void (*)(int status);

    /// `exit` ends the process for `killService`; it may be called on any thread.
    explicit ZRReportingService(Context& context, ExitProcess exit = std::_Exit);
    ~ZRReportingService() override;
    ZRReportingService(const ZRReportingService&) = delete;
    ZRReportingService& operator=(const ZRReportingService&) = delete;

    bool shouldAcceptNewConnection(ClientConnection& connection) override;

    /// Ends every client, behind its requests, as if its connection had been lost; requests that wait for
    /// more than five seconds are dropped then, unanswered, and sessions that are not stopped three seconds
    /// later go without. Once all clients have left, stops the single-message session and calls `completed`,
    /// on the reporting server queue. Any thread, once.
    void shutDown(UniqueFunction<void()> completed);

    /// While it is off, lookups find nothing and messages are refused. Nothing turns it off: no request, and
    /// not the preference `disable_reporting`. Any thread.
    void setReportingEnabled(bool enabled) noexcept { reportingEnabled_ = enabled; }
    /// Null when there is none now.
    [[nodiscard]] SessionRef singleMessageSession() const { return singleMessages_->singleMessageSession(); }

    /// What the clients of each user hold together.
    [[nodiscard]] const UserAccounts& accounts() const noexcept { return accounts_; }
    [[nodiscard]] const std::vector<ClientRef>& getAllClients() const override { return clients_; }
    [[nodiscard]] bool isReportingEnabled() const noexcept override { return reportingEnabled_; }
    [[nodiscard]] std::vector<SessionRef> getAllActiveReportingSessions() override;
    [[nodiscard]] SessionRef findReportingSessionForID(ReporterID reporterID) override;
    void findReportingSessionsForIDs(std::span<const ReporterID> reporterIDs,
                                     std::vector<SessionRef>& found) override;
    [[nodiscard]] std::optional<StartedWalk> findFirstStarted(std::vector<SessionRef>& found) override;
    [[nodiscard]] std::optional<StartedWalk> findNextStarted(const StartedWalk& walk,
                                                             std::vector<SessionRef>& found) override;
    bool removeClient(ZRReportingClientServerInstance& client) override;
    void clientHasLeft(const ClientRef& client) override;
    [[nodiscard]] UserAccount& accountOf(uid_t user) override {
        return accounts_.try_emplace(user, *context_.platform().activity).first->second;
    }
    void logReportingSessions() override;
    void sessionChanged(const ZRReportingClientServerInstance& client, ReporterID reporterID,
                        const SessionRef& session) override;
    void exitProcess(int status) override { exitProcess_(status); }

private:
    void addClient(const ClientRef& client);
    [[nodiscard]] std::vector<ClientRef>::iterator placeOf(const ZRReportingClientServerInstance& client);
    void endAllClients(UniqueFunction<void()> completed);
    void dropRequests();
    void dropClients();
    /// Calls the function on the server queue, if the shutdown still lasts by then.
    void callInShutdown(std::chrono::milliseconds delay, void (ZRReportingService::*function)());
    void completeShutdown();
    void logSessionsOfClients() const;
    void setHandlers(ClientConnection& connection, const ClientRef& client);

    Context& context_;
    const ExitProcess exitProcess_;
    std::atomic<bool> reportingEnabled_{true};
    std::uint64_t lastAcceptanceOrder_ = 0; ///< the listener's thread's
    std::vector<ClientRef> clients_;
    std::map<std::uint64_t, ClientRef> leavingClients_; ///< whose sessions are still to be stopped
    SessionRegistry sessions_;
    UserAccounts accounts_;
    bool isShuttingDown_ = false;
    UniqueFunction<void()> shutdownCompleted_; ///< until it has been called
    std::unique_ptr<DelayedCall> shutdownPatience_;
    const std::shared_ptr<SingleMessageSessionKeeper> singleMessages_;
    /// Clients and queued work hold the service weakly, through this; it owns nothing.
    std::shared_ptr<ZRReportingService> self_;
};

} // namespace tamblo
