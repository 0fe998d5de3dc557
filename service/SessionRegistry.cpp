#include "service/SessionRegistry.h"

#include "session/ZRReportingSession.h"

#include <algorithm>

namespace tamblo {

void SessionRegistry::set(ReporterID reporterID, const Entry& entry) {
    const auto startedKey = std::pair(entry.clientOrder, reporterID);
    if (entry.session != nullptr && entry.session->started() && !entry.session->isStopping()) {
        Started& started = started_[startedKey];
        if (started.session != entry.session) {
            started = {entry.session, ++lastStart_};
        }
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

std::optional<StartedWalk> SessionRegistry::findStarted(const std::optional<StartedWalk>& walk,
                                                        std::size_t atMost,
                                                        std::vector<SessionRef>& found) const {
    StartedWalk reached{.last = {}, .newest = walk ? walk->newest : lastStart_};
    auto place = walk ? started_.upper_bound(walk->last) : started_.begin();
    for (std::size_t left = atMost; place != started_.end(); ++place) {
        if (place->second.number > reached.newest) {
            continue;
        }
        if (left-- == 0) {
            return reached;
        }
        found.push_back(place->second.session);
        reached.last = place->first;
    }
    return std::nullopt;
}

} // namespace tamblo
