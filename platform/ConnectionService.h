#pragma once

#include "base/UniqueFunction.h"
#include "platform/ClientIdentity.h"
#include "platform/WorkQueue.h"
#include "platform/ZRReportingServiceProtocol.h"

#include <memory>
#include <string>
#include <string_view>

#include <sys/types.h>

namespace tamblo {

/// One client's connection. Set up inside the accept callback, then resumed; from then on the service holds
/// it no longer and hears of it through the handlers, on the connection's thread.
class ClientConnection {
public:
    virtual ~ClientConnection() = default;
    /// The user and the process at the other end, when it connected.
    [[nodiscard]] virtual ClientIdentity peer() const noexcept = 0;
    [[nodiscard]] pid_t peerProcessIdentifier() const noexcept { return peer().process; }
    /// Whether that process still has its identifier: what was read of it by that is its own then.
    [[nodiscard]] virtual bool isPeerThere() const noexcept = 0;
    /// Where the client's requests are carried out, in turns with other clients'. What is posted behind a
    /// request runs behind it.
    [[nodiscard]] virtual const std::shared_ptr<RequestQueue>& requestQueue() const noexcept = 0;
    /// The object that answers the client's requests; held until the connection has ended.
    virtual void setExportedObject(std::shared_ptr<ZRReportingServiceProtocol> object) = 0;
    /// Called once when the connection breaks off (a reset, a protocol error).
    virtual void setInterruptionHandler(UniqueFunction<void()> handler) = 0;
    /// Called once when the connection has ended for good, after any interruption.
    virtual void setInvalidationHandler(UniqueFunction<void()> handler) = 0;
    virtual void resume() = 0;
    [[nodiscard]] virtual std::string description() const = 0;
};

/// Decides about each new connection; called on the listener's thread.
class ListenerDelegate {
public:
    virtual ~ListenerDelegate() = default;
    /// False turns the client away.
    virtual bool shouldAcceptNewConnection(ClientConnection& connection) = 0;
};

/// The named listener of the interprocess connection service. Accepts from `resume` on.
class ConnectionListener {
public:
    virtual ~ConnectionListener() = default;
    /// The delegate must outlive the listener.
    virtual void setDelegate(ListenerDelegate& delegate) = 0;
    virtual void resume() = 0;
};

/// Where clients come from. Used by the entry point, before anything else runs.
class ConnectionService {
public:
    virtual ~ConnectionService() = default;
    /// The listener for an interprocess service name; one per process.
    [[nodiscard]] virtual ConnectionListener& listenerForServiceName(std::string_view serviceName) = 0;
};

} // namespace tamblo
