#pragma once

#include "session/ZRReportingSessionMessage.h"
#include "util/AudioEvents.h"
#include "util/Context.h"
#include "workers/sinks/zeph/WorkerInstanceState.h"

#include <memory>
#include <optional>
#include <span>
#include <string_view>
#include <utility>

namespace tamblo {

class ZRReportingSession;

/// A detector: says which messages hint at one audio problem, and asks for a capture once the worker finds
/// that there were enough of them.
///
/// Owned by the bug-capture worker of a session, which it holds weakly; all operations are called by that
/// worker, on the thread that does the session's work. What answers a request for a capture may come on any
/// thread and when the detector is gone: it holds the state weakly and never the detector.
class ZRReportingSessionZephWorkerInstance {
public:
    ZRReportingSessionZephWorkerInstance(Context& context, std::weak_ptr<ZRReportingSession> session) noexcept
        : context_(context), session_(std::move(session)) {}
    virtual ~ZRReportingSessionZephWorkerInstance() = default;
    ZRReportingSessionZephWorkerInstance(const ZRReportingSessionZephWorkerInstance&) = delete;
    ZRReportingSessionZephWorkerInstance& operator=(const ZRReportingSessionZephWorkerInstance&) = delete;

    /// Asked only for messages of the type that the detector's class looks at. Depends on nothing but the
    /// message and the session.
    [[nodiscard]] virtual bool interestedInMessage(const ZRReportingSessionMessage& message) const = 0;

    /// Null once the session is gone.
    [[nodiscard]] std::shared_ptr<ZRReportingSession> session() const noexcept { return session_.lock(); }
    /// Null for a detector that counts nothing, which then is never interested.
    [[nodiscard]] const std::shared_ptr<WorkerInstanceState>& workerState() const noexcept {
        return workerState_;
    }
    void setWorkerState(std::shared_ptr<WorkerInstanceState> state) noexcept {
        workerState_ = std::move(state);
    }

    virtual void start() {}
    /// Whether the detector fires at all; one that does not only counts.
    [[nodiscard]] virtual bool canFire() const noexcept { return false; }
    /// Asks the state's reporter, which was made for this firing, for a capture. Waits for nothing.
    virtual void fire(const ZRReportingSessionMessage&) {}
    /// An interesting message, before it is found out whether the detector fires.
    virtual void handleMessage(const ZRReportingSessionMessage&) {}
    virtual void stop() {}

protected:
    [[nodiscard]] Context& context() const noexcept { return context_; }

private:
    Context& context_;
    std::weak_ptr<ZRReportingSession> session_;
    std::shared_ptr<WorkerInstanceState> workerState_;
};

/// Describes one detector class.
struct ZephWorkerInstanceClass {
    using Factory = std::unique_ptr<ZRReportingSessionZephWorkerInstance> (*)(
        Context&, const std::shared_ptr<ZRReportingSession>&);

    std::string_view name;
    /// The one type of message that its detectors look at, so that all others cost them nothing. None for a
    /// class that is never interested.
    std::optional<AudioEventType> messageType = std::nullopt;
    bool handleSingleMessageSession = false;
    /// The boolean device property that has to be true for sessions to have such a detector; empty when all
    /// have one.
    std::string_view deviceProperty = {};
    /// A detector with its thresholds set, or null when it refuses.
    Factory initWithSession = nullptr;
};

/// All detector classes, in the order in which the worker makes and asks their detectors.
[[nodiscard]] std::span<const ZephWorkerInstanceClass> zephWorkerInstanceClasses();

} // namespace tamblo
