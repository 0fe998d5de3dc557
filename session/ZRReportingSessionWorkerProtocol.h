#pragma once

#include "session/ZRReportingSessionMessage.h"
#include "util/Context.h"

#include <memory>
#include <optional>
#include <utility>

namespace tamblo {

class ZRReportingSession;

/// One worker of one session. Made by its class's factory, owned by the session, and called on the reporting
/// server queue. It holds its session weakly; a session may go without having been stopped, so whatever a
/// worker registers elsewhere ends with the worker.
class ZRReportingSessionWorkerProtocol {
public:
    ZRReportingSessionWorkerProtocol(Context& context, std::weak_ptr<ZRReportingSession> session)
        : context_(context), session_(std::move(session)) {}
    virtual ~ZRReportingSessionWorkerProtocol() = default;
    ZRReportingSessionWorkerProtocol(const ZRReportingSessionWorkerProtocol&) = delete;
    ZRReportingSessionWorkerProtocol& operator=(const ZRReportingSessionWorkerProtocol&) = delete;

    /// Null once the session is gone.
    [[nodiscard]] std::shared_ptr<ZRReportingSession> session() const noexcept { return session_.lock(); }
    /// Gives the worker another session; it is made with its own.
    void setSession(std::weak_ptr<ZRReportingSession> session) noexcept { session_ = std::move(session); }
    /// Set by the session alone, after `start` and `stop`.
    [[nodiscard]] bool started() const noexcept { return started_; }
    void setStarted(bool started) noexcept { started_ = started; }

    /// Whether the worker is started now; nothing from a worker that has nothing to do at its start, which
    /// then is.
    virtual std::optional<bool> start() { return std::nullopt; }
    /// Does the next part of the stop; whether it is done. Called only while started. A producer sends its
    /// derived messages from here, through the session. Some milliseconds at most: a worker that walks all
    /// messages of its session does so in parts, between which the server queue does the work of others. The
    /// session's messages stay as they are meanwhile.
    [[nodiscard]] virtual bool stopSome() { return true; }
    /// The whole stop at once.
    void stop() {
        while (!stopSome()) {
        }
    }

    /// For consumers. One message, which other workers share; what goes wrong with it is the worker's own to
    /// log.
    virtual void handleMessage(const MessageRef&) {}
    /// Whether messages that repeat the last one are offered, too.
    [[nodiscard]] virtual bool handleRedundantMessages() const { return false; }

protected:
    [[nodiscard]] Context& context() const noexcept { return context_; }
    [[nodiscard]] const Platform& platform() const noexcept { return context_.platform(); }

private:
    Context& context_;
    std::weak_ptr<ZRReportingSession> session_;
    bool started_ = false;
};

/// A producer derives messages and sends them through its session, a consumer is offered the session's
/// messages; which of these a worker is, its class's role says, and nothing else.
using ZRReportingSessionWorkerProducerProtocol = ZRReportingSessionWorkerProtocol;
using ZRReportingSessionWorkerConsumerProtocol = ZRReportingSessionWorkerProtocol;

} // namespace tamblo
