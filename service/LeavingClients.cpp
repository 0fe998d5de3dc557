#include "service/LeavingClients.h"

#include "session/ZRReportingSession.h"
#include "util/Log.h"

#include <cstddef>
#include <utility>

namespace tamblo {

namespace {

/// What one piece of work stops at most: as much as takes a few milliseconds. A request that comes meanwhile
/// waits for two pieces, the one at hand and the one whose batch it shares. A session with more messages is a
/// piece by itself.
constexpr std::size_t kSessionsPerPiece = 32;
constexpr std::size_t kMessagesPerPiece = 5'000;

} // namespace

void LeavingClients::add(ClientRef client, SessionMap sessions) {
    Leaving leaving{std::move(client), std::move(sessions)};
    if (!stopSomeOf(leaving)) {
        clients_.push_back(std::move(leaving));
    }
}

void LeavingClients::stopSome() {
    if (!clients_.empty() && stopSomeOf(clients_.front())) {
        clients_.pop_front();
    }
}

void LeavingClients::stopAll() {
    while (!clients_.empty()) {
        stopSome();
    }
}

bool LeavingClients::stopSomeOf(Leaving& leaving) {
    SessionMap& sessions = leaving.sessions;
    std::size_t messages = 0;
    for (std::size_t stopped = 0; stopped < kSessionsPerPiece && !sessions.empty(); ++stopped) {
        messages += sessions.begin()->second->messages().size();
        if (stopped > 0 && messages > kMessagesPerPiece) {
            break;
        }
        // Let go as soon as it is stopped, so that what it holds is not freed all at once in the end.
        const SessionRef session = std::move(sessions.extract(sessions.begin()).mapped());
        if (session->started()) {
            session->stop();
        }
    }
    if (!sessions.empty()) {
        return false;
    }
    log::standard(ZRReportingServiceDelegateCategory(), "removing {} from the server client list",
                  leaving.client->processIdentifier());
    return true;
}

} // namespace tamblo
