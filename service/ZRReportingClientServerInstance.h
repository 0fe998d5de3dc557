#pragma once

#include "platform/ClientIdentity.h"
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
/// Held by its connection, by the service among its clients, and by its queued work. The requests come on the
/// connection's thread, which only queues them; everything else happens on the reporting server queue, in the
/// client's turns, and so do all fields that are not constant.
///
/// What takes long is carried out in parts, between which other clients have their turns: a stop, a message
/// to very many sessions, the end of a client with thousands of sessions. The client's next request waits for
/// the last part, and a message to a session that is being stopped waits for its end; so nobody sees the
/// parts but in that others are answered meanwhile.
///
/// In three files: messages in `ClientMessages.cpp`, the ends of sessions and of the client in
/// `ClientStops.cpp`, all else in the class's own.
class ZRReportingClientServerInstance final
    : public ZRReportingServiceProtocol,
      public std::enable_shared_from_this<ZRReportingClientServerInstance> {
public:
    using SessionMap = std::map<ReporterID, SessionRef>;

    /// What is known of a client when it connects.
    struct Acceptance {
        ClientIdentity identity;
        std::uint64_t order; ///< the client's place in the order of acceptance, from 1
        WallTime startDate;
        std::optional<std::string> processName;
    };

    ZRReportingClientServerInstance(Context& context, Acceptance acceptance,
                                    std::shared_ptr<RequestQueue> requests,
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
    /// The same without the requests that wait: those are dropped. On the server queue.
    void endAtOnce();
    /// Drops whatever is left to do for the client. How many sessions are not stopped for that. On the server
    /// queue.
    std::size_t abandon();

    [[nodiscard]] SessionRef findReportingSessionForID(ReporterID reporterID, bool acrossAllClients) const;

    [[nodiscard]] const ClientIdentity& identity() const noexcept { return acceptance_.identity; }
    /// What the client has asked for.
    [[nodiscard]] const RequestTally& tally() const noexcept { return requests_->tally(); }
    [[nodiscard]] pid_t processIdentifier() const noexcept { return acceptance_.identity.process; }
    [[nodiscard]] uid_t user() const noexcept { return acceptance_.identity.user; }
    [[nodiscard]] const SessionMap& clientReportingSessionMap() const noexcept {
        return clientReportingSessionMap_;
    }
    [[nodiscard]] std::optional<WallTime> clientStartDate() const noexcept { return acceptance_.startDate; }
    [[nodiscard]] const std::optional<std::string>& clientProcessName() const noexcept {
        return acceptance_.processName;
    }
    /// True for the first caller alone, who then reports how long the client was there.
    [[nodiscard]] bool claimUptimeReport() noexcept { return !std::exchange(isUptimeReported_, true); }
    [[nodiscard]] std::uint64_t acceptanceOrder() const noexcept { return acceptance_.order; }

private:
    using Delegate = std::shared_ptr<ZRReportingServiceDelegateProtocol>;
    struct Sending;

    /// Queues a piece of this client's work; `piece` is called with the client.
    template <typename Piece> void onServerQueue(Pace pace, Piece piece) {
        auto work = [client = shared_from_this(), piece = std::move(piece)]() mutable { piece(*client); };
        requests_->post(std::move(work), pace);
    }
    /// Queues the rest of the request at hand.
    template <typename Piece> void afterTurnsOfOthers(Pace pace, Piece piece) {
        auto work = [client = shared_from_this(), piece = std::move(piece)]() mutable { piece(*client); };
        requests_->postNext(std::move(work), pace);
    }
    void performCreate(ReporterID reporterID, BooleanReply reply);
    void performSetServiceType(std::uint16_t serviceType, ReporterID reporterID);
    void performSetConfiguration(const Dictionary& configuration, ReporterID reporterID, BooleanReply reply);
    void performStart(ReporterID reporterID, BooleanReply reply);
    void performSend(Dictionary message, std::uint32_t category, std::uint16_t type,
                     const std::vector<ReporterID>& reporterIDs, ErrorReply reply);
    void sendSome(const std::shared_ptr<Sending>& sending);
    [[nodiscard]] bool findRecipients(Sending& sending) const;
    void goOnWhenStopped(ZRReportingSession& session, const std::shared_ptr<Sending>& sending);
    void performStop(ReporterID reporterID, BooleanReply reply);
    void finishStop(ReporterID reporterID, const SessionRef& session, BooleanReply reply);
    void performDestroy(ReporterID reporterID, BooleanReply reply);
    void finishDestroy(ReporterID reporterID, BooleanReply reply);
    /// Stops the session, in parts if it is large, and calls `finish` with this client.
    template <typename Finish> void stopThen(const SessionRef& session, Finish finish);
    void endConnection();
    void leaveSome();
    /// Takes the session out of what the client and its user have, and lets it go.
    void letGoOf(SessionMap::iterator entry);

    [[nodiscard]] SessionRef makeSession(ReporterID reporterID) const;
    void storeSession(ReporterID reporterID, SessionRef session);
    /// The service for as long as the client is one of its own: the sessions of one that has left are not
    /// found. Then null.
    [[nodiscard]] Delegate presentDelegate() const { return hasLeft_ ? nullptr : delegate_.lock(); }
    /// What the user's clients hold, or null. For the piece of work at hand.
    [[nodiscard]] UserAccount* account() const;
    [[nodiscard]] std::optional<ReplyError> beyondLimitOfSessions() const;
    [[nodiscard]] std::optional<ReplyError>
    beyondLimitOfConfiguration(const Dictionary& added, std::size_t before, std::size_t after) const;
    void sessionChanged(ReporterID reporterID, const SessionRef& session) const;
    void logReportingSessions() const;
    [[nodiscard]] bool isReportingEnabled() const noexcept;

    Context& context_;
    const Acceptance acceptance_;
    const std::shared_ptr<RequestQueue> requests_;
    const std::weak_ptr<ZRReportingServiceDelegateProtocol> delegate_;
    SessionMap clientReportingSessionMap_;
    bool hasLeft_ = false; ///< what is left in the map is still to be stopped
    bool isUptimeReported_ = false;
    /// The sessions of the message at hand; kept for its memory.
    std::vector<SessionRef> recipients_;
};

} // namespace tamblo
