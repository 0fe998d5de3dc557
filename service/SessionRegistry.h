#pragma once

#include "base/Hash.h"
#include "service/ZRReportingServiceDelegateProtocol.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <unordered_map>
#include <utility>
#include <vector>

#include <sys/types.h>

namespace tamblo {

/// The sessions of all clients by reporter ID, and the started ones among them in client order: what walks
/// over the clients would find, at a cost that does not grow with their number. A member of the service, on
/// the reporting server queue.
class SessionRegistry {
public:
    struct Entry {
        std::uint64_t clientOrder = 0; ///< the client's place in the order of acceptance
        pid_t clientProcessIdentifier = 0;
        SessionRef session;
    };

    /// What a client now holds under an ID; without a session, nothing.
    void set(ReporterID reporterID, const Entry& entry);
    /// The entry of the first client in order of acceptance that has the ID, or null.
    [[nodiscard]] const Entry* find(ReporterID reporterID) const noexcept;
    /// Appends the started ones: client by client in order of acceptance, by ID within each. Without a walk
    /// from the first on. Where they end; nothing when no further one can be there.
    std::optional<StartedWalk> findStarted(const std::optional<StartedWalk>& walk, std::size_t atMost,
                                           std::vector<SessionRef>& found) const;
    [[nodiscard]] std::size_t startedCount() const noexcept { return started_.size(); }

private:
    /// Almost always one client holds an ID; more are in order of acceptance.
    std::unordered_map<ReporterID, std::vector<Entry>, SeededHash> holders_;
    struct Started {
        SessionRef session;
        std::uint64_t number = 0; ///< in the order of their starts
    };
    std::map<std::pair<std::uint64_t, ReporterID>, Started> started_;
    std::uint64_t lastStart_ = 0;
};

} // namespace tamblo
