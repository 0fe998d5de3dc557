#pragma once

#include "service/ZRReportingClientServerInstance.h"
#include "service/ZRReportingServiceDelegateProtocol.h"

#include <deque>

namespace tamblo {

/// The clients that nobody finds any more, but whose sessions are still to be stopped; the first to leave
/// comes first.
///
/// A client may leave ten thousand sessions behind. To stop them all in one piece of work would take a second
/// or more in which no other client is answered, so a piece stops a few. The service, whose member this is,
/// queues one further piece at a time for as long as there is something left, however many clients leave
/// together. On the reporting server queue. What is left at the end of its life is dropped unstopped.
class LeavingClients {
public:
    using SessionMap = ZRReportingClientServerInstance::SessionMap;

    /// Stops the first few of the client's sessions.
    void add(ClientRef client, SessionMap sessions);
    /// Stops the next few sessions of the client that left first.
    void stopSome();
    void stopAll();
    [[nodiscard]] bool isEmpty() const noexcept { return clients_.empty(); }

private:
    struct Leaving {
        ClientRef client;
        SessionMap sessions;
    };

    /// Answers whether the client has left altogether.
    static bool stopSomeOf(Leaving& leaving);

    std::deque<Leaving> clients_;
};

} // namespace tamblo
