#pragma once

#include "platform/Clock.h"
#include "platform/WorkQueue.h"
#include "platform/ZRReportingServiceProtocol.h"
#include "service/ZRReportingServiceDelegateProtocol.h"
#include "util/Context.h"

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <sys/types.h>

namespace tamblo {

/// One client: the service's answers to its requests, one object for each connection; owns the client's
/// sessions, by reporter ID.
///
/// Held by its connection, by the service among its clients or among those that leave (`LeavingClients`), and
/// by its queued requests. The requests come on the connection's thread, which only queues them; everything
/// else happens on the reporting server queue, and so do all fields but the process identifier.
class ZRReportingClientServerInstance final
    : public ZRReportingServiceProtocol,
      public std::enable_shared_from_this<ZRReportingClientServerInstance> {
public:
    using SessionMap = std::map<ReporterID, SessionRef>;

    ZRReportingClientServerInstance(Context& context, pid_t processIdentifier,
                                    std::weak_ptr<ZRReportingServiceDelegateProtocol> delegate);
    ~ZRReportingClientServerInstance() override;
    ZRReportingClientServerInstance(const ZRReportingClientServerInstance&) = delete;
    ZRReportingClientServerInstance& operator=(const ZRReportingClientServerInstance&) = delete;

    void createReportingSession(ReporterID reporterID, BooleanReply reply) override;
    void setServiceType(std::uint16_t serviceType, ReporterID reporterID, BooleanReply reply) override;
    /// Despite its name, answers the service type.
    void getServiceNameForReporterID(ReporterID reporterID, ServiceTypeReply reply) override;
    void setConfiguration(Dictionary configuration, ReporterID reporterID, BooleanReply reply) override;
    void startReportingSessionForID(ReporterID reporterID, BooleanReply reply) override;
    void sendMessage(Dictionary message, std::uint32_t category, std::uint16_t type,
                     std::vector<ReporterID> reporterIDs, ErrorReply reply) override;
    void stopReportingSessionForID(ReporterID reporterID, BooleanReply reply) override;
    void destroyReportingSession(ReporterID reporterID, BooleanReply reply) override;
    void reporterID(ReporterID reporterID, DictionaryReply reply) override;
    void getAllReporters(ReporterIDsReply reply) override;
    void killService() override;

    /// The connection is lost: queues the end of this client. Any thread.
    void handleConnectionError();
    /// Leaves the service, which stops the started sessions; nothing when that was done before. No held start
    /// reply is answered.
    void endConnection();
    /// The sessions, which are the client's no more.
    [[nodiscard]] SessionMap takeSessions() noexcept { return std::exchange(clientReportingSessionMap_, {}); }

    [[nodiscard]] SessionRef findReportingSessionForID(ReporterID reporterID, bool acrossAllClients) const;

    [[nodiscard]] pid_t processIdentifier() const noexcept { return processIdentifier_; }
    [[nodiscard]] const SessionMap& clientReportingSessionMap() const noexcept {
        return clientReportingSessionMap_;
    }
    [[nodiscard]] const std::optional<WallTime>& clientStartDate() const noexcept { return clientStartDate_; }
    [[nodiscard]] const std::optional<std::string>& clientProcessName() const noexcept {
        return clientProcessName_;
    }
    void setClientStartDate(std::optional<WallTime> date) noexcept { clientStartDate_ = date; }
    void setClientProcessName(std::optional<std::string> name) { clientProcessName_ = std::move(name); }
    /// True for the first caller alone, who then reports how long the client was there.
    [[nodiscard]] bool claimUptimeReport() noexcept { return !std::exchange(isUptimeReported_, true); }
    /// The client's place in the order of acceptance, from 1; 0 while it is not among the service's clients.
    [[nodiscard]] std::uint64_t acceptanceOrder() const noexcept { return acceptanceOrder_; }
    void setAcceptanceOrder(std::uint64_t order) noexcept { acceptanceOrder_ = order; }

private:
    using Delegate = std::shared_ptr<ZRReportingServiceDelegateProtocol>;

    /// Queues a piece of this client's work; `piece` is called with the client.
    template <typename Piece> void onServerQueue(Pace pace, Piece piece);
    void performSetServiceType(std::uint16_t serviceType, ReporterID reporterID);
    void performStart(ReporterID reporterID, BooleanReply reply);
    void performSend(Dictionary message, std::uint32_t category, std::uint16_t type,
                     const std::vector<ReporterID>& reporterIDs, ErrorReply reply);
    void performStop(ReporterID reporterID);
    void performDestroy(ReporterID reporterID);

    [[nodiscard]] SessionRef makeSession(ReporterID reporterID) const;
    void storeSession(ReporterID reporterID, SessionRef session);
    void sessionChanged(ReporterID reporterID, const SessionRef& session) const;
    void logReportingSessions() const;
    [[nodiscard]] bool isReportingEnabled() const noexcept;

    Context& context_;
    const pid_t processIdentifier_;
    const std::weak_ptr<ZRReportingServiceDelegateProtocol> delegate_;
    std::optional<WallTime> clientStartDate_;
    std::optional<std::string> clientProcessName_;
    SessionMap clientReportingSessionMap_;
    std::uint64_t acceptanceOrder_ = 0;
    bool isUptimeReported_ = false;
    /// The sessions of the message at hand; kept for its memory.
    std::vector<SessionRef> recipients_;
};

} // namespace tamblo
