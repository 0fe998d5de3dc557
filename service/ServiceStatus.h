#pragma once

#include "base/UniqueFunction.h"
#include "platform/StatusSource.h"
#include "service/ZRReportingService.h"

#include <cstddef>
#include <memory>
#include <vector>

namespace tamblo {

/// Answers those who want to see the service's state. What has many rows is gathered on the server queue in
/// slices of some hundred, each well below a millisecond, between which clients have their turns. Made by the
/// entry point after the service, and gone before it.
class ServiceStatus final : public StatusSource {
public:
    ServiceStatus(Context& context, const ZRReportingService& service);
    ~ServiceStatus() override;
    ServiceStatus(const ServiceStatus&) = delete;
    ServiceStatus& operator=(const ServiceStatus&) = delete;

    void clients(Reply<std::vector<ClientRow>> reply) override;
    void sessions(Reply<std::vector<SessionRow>> reply) override;
    void session(ReporterID reporterID, Reply<std::vector<SessionDetail>> reply) override;
    void users(Reply<std::vector<UserRow>> reply) override;

private:
    struct Walk;

    /// Posts a piece of the server queue's, which is called with this.
    template <typename Piece> void onServerQueue(Piece piece);
    void walkSome(std::unique_ptr<Walk> walk);
    /// Whether it is over.
    [[nodiscard]] bool walkSlice(Walk& walk) const;

    Context& context_;
    const ZRReportingService& service_;
    /// What is queued holds this weakly, through this; it owns nothing.
    std::shared_ptr<ServiceStatus> self_;
};

} // namespace tamblo
