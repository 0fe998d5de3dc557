#include "service/SessionRegistry.h"

#include "session/ZRReportingSession.h"

#include <algorithm>

namespace tamblo {

void SessionRegistry::set(ReporterID reporterID, const Entry& entry) {
    const auto startedKey = std::pair(entry.clientOrder, reporterID);
    if (entry.session != nullptr && entry.session->started() && !entry.session->isStopping()) {
        started_.insert_or_assign(startedKey, entry.session);
    } else {
        started_.erase(startedKey);
    }
    std::vector<Entry>& holders = holders_[reporterID];
    const auto place =
        std::lower_bound(holders.begin(), holders.end(), entry.clientOrder,
                         [](const Entry& other, std::uint64_t order) { return other.clientOrder < order; });
    const bool isHolder = place != holders.end() && place->clientOrder == entry.clientOrder;
    if (entry.session == nullptr) {
        if (isHolder) {
            holders.erase(place);
        }
    } else if (isHolder) {
        *place = entry;
    } else {
        holders.insert(place, entry);
    }
    if (holders.empty()) {
        holders_.erase(reporterID);
    }
}

const SessionRegistry::Entry* SessionRegistry::find(ReporterID reporterID) const noexcept {
    const auto held = holders_.find(reporterID);
    return held != holders_.end() ? &held->second.front() : nullptr;
}

std::vector<SessionRef> SessionRegistry::startedSessions(std::size_t atMost) const {
    std::vector<SessionRef> sessions;
    sessions.reserve(std::min(atMost, started_.size()));
    for (auto started = started_.begin(); started != started_.end() && sessions.size() != atMost; ++started) {
        sessions.push_back(started->second);
    }
    return sessions;
}

} // namespace tamblo
