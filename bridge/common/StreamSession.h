#pragma once

#include "bridge/common/Reporter.h"
#include "bridge/common/Settings.h"

#include <optional>
#include <string>
#include <utility>

namespace tamblo::bridge {

/// What makes streams that follow each other one session.
struct StreamKind {
    std::string application;
    ServiceType serviceType = ServiceType::generic;
    bool isInput = false;

    bool operator==(const StreamKind&) const = default;
};

/// The reporting session of one application's streams that follow each other. It says what it is given, as
/// messages of a well-reporting client: everything at its start and whenever sound begins to run; what has
/// changed while it runs; at the end of each period of activity that it ended, and how long it was.
///
/// Owned by `SessionPool`.
class StreamSession {
public:
    StreamSession(Reporter& reporter, StreamKind kind) : reporter_(reporter), kind_(std::move(kind)) {}

    [[nodiscard]] const StreamKind& kind() const noexcept { return kind_; }
    [[nodiscard]] SessionID id() const noexcept { return id_; }
    [[nodiscard]] bool isRunning() const noexcept { return runningSince_.has_value(); }

    /// How the stream is at a moment; begins the session if there is none and the service is reached.
    void update(const StreamSettings& now, const Moment& at);
    /// The stream has gone; the session goes on.
    void stopStream(const Moment& at);
    void end(const Moment& at);
    /// The session went with the service, and will be another one.
    void forget();

private:
    void say(EventCategory category, EventType type, Dictionary payload, const Moment& at);
    void start(const Moment& at);
    void stop(const Moment& at);
    [[nodiscard]] EventCategory ownCategory() const noexcept;

    Reporter& reporter_;
    const StreamKind kind_;
    SessionID id_ = kNoSession;
    std::optional<Moment> runningSince_;
    Dictionary settings_; ///< as of the last update
    std::int64_t messages_ = 0;
};

} // namespace tamblo::bridge
