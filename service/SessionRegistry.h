#pragma once

#include "base/Hash.h"
#include "service/ZRReportingServiceDelegateProtocol.h"

#include <cstddef>
#include <cstdint>
#include <map>
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
    /// Client by client in order of acceptance, by ID within each; the first of them when fewer are wanted.
    [[nodiscard]] std::vector<SessionRef>
    startedSessions(std::size_t atMost = static_cast<std::size_t>(-1)) const;
    [[nodiscard]] std::size_t startedCount() const noexcept { return started_.size(); }

private:
    /// Almost always one client holds an ID; more are in order of acceptance.
    std::unordered_map<ReporterID, std::vector<Entry>, SeededHash> holders_;
    std::map<std::pair<std::uint64_t, ReporterID>, SessionRef> started_;
};

} // namespace tamblo
