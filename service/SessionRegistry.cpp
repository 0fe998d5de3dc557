#include "service/SessionRegistry.h"

#include "session/ZRReportingSession.h"

#include <algorithm>

namespace tamblo {

void SessionRegistry::set(ReporterID reporterID, const Entry& entry) {
    const auto startedKey = std::pair(entry.clientOrder, reporterID);
    if (entry.session != nullptr && entry.session->started()) {
        started_.insert_or_assign(startedKey, entry.session);
    } else {
        started_.erase(startedKey);
    }
    if (entry.session != nullptr) {
        put(holders_[reporterID], entry);
        return;
    }
    const auto held = holders_.find(reporterID);
    if (held != holders_.end() && takeOut(held->second, entry.clientOrder)) {
        holders_.erase(held);
    }
}

const SessionRegistry::Entry* SessionRegistry::find(ReporterID reporterID) const noexcept {
    const auto held = holders_.find(reporterID);
    return held != holders_.end() ? &held->second.first : nullptr;
}

std::vector<SessionRef> SessionRegistry::startedSessions(std::size_t atMost) const {
    std::vector<SessionRef> sessions;
    sessions.reserve(std::min(atMost, started_.size()));
    for (auto started = started_.begin(); started != started_.end() && sessions.size() != atMost; ++started) {
        sessions.push_back(started->second);
    }
    return sessions;
}

void SessionRegistry::put(Holders& holders, Entry entry) {
    if (holders.first.session == nullptr || holders.first.clientOrder == entry.clientOrder) {
        holders.first = std::move(entry);
        return;
    }
    if (entry.clientOrder < holders.first.clientOrder) {
        std::swap(entry, holders.first);
    }
    const auto place =
        std::lower_bound(holders.others.begin(), holders.others.end(), entry.clientOrder,
                         [](const Entry& other, std::uint64_t order) { return other.clientOrder < order; });
    if (place != holders.others.end() && place->clientOrder == entry.clientOrder) {
        *place = std::move(entry);
    } else {
        holders.others.insert(place, std::move(entry));
    }
}

bool SessionRegistry::takeOut(Holders& holders, std::uint64_t clientOrder) {
    if (holders.first.clientOrder != clientOrder) {
        std::erase_if(holders.others,
                      [clientOrder](const Entry& other) { return other.clientOrder == clientOrder; });
        return false;
    }
    if (holders.others.empty()) {
        return true;
    }
    holders.first = std::move(holders.others.front());
    holders.others.erase(holders.others.begin());
    return false;
}

} // namespace tamblo
