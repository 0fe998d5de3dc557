#pragma once

#include "bridge/common/Reporter.h"
#include "bridge/common/Time.h"
#include "bridge/pipewire/graph/Graph.h"
#include "bridge/pipewire/graph/Namespace.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string_view>

namespace tamblo::pipewire {

/// The session of the device itself: which devices there are, which of them are the default ones, their
/// profiles and rates, the server's clock and its restarts. What is there is said when the session begins,
/// then what changes. It is stopped, and begun anew, once a day.
///
/// The loop's thread.
class DeviceSession final : public GraphObserver, public ReporterListener, public Timed {
public:
    static constexpr std::chrono::milliseconds kSettling{100};
    static constexpr std::chrono::hours kLength{24};
    /// Messages of one look at the server's world; what a later look finds still changed it says then.
    static constexpr std::size_t kMostMessages = 64;

    DeviceSession(const Graph& graph, Reporter& reporter, const Clock& clock)
        : graph_(graph), reporter_(reporter), clock_(clock) {}

    [[nodiscard]] SessionID id() const noexcept { return id_; }

    void graphChanged(const GraphEvent& event) override;
    void reporterCame() override;
    void reporterWent() override;
    [[nodiscard]] std::optional<SteadyTime> due() const override;
    void run() override;

    /// Looks at everything that has changed without waiting for it to settle.
    void settle();
    void end();

private:
    using Devices = std::map<ObjectID, Dictionary>;

    void begin(const Moment& at);
    void forget();
    void sayServer(const Dictionary& now, const Moment& at);
    void sayDevices(const Devices& now, const Moment& at);
    void say(EventKind kind, EventType type, Dictionary payload, const Moment& at);

    const Graph& graph_;
    Reporter& reporter_;
    const Clock& clock_;
    SessionID id_ = kNoSession;
    std::optional<Moment> begun_;
    std::optional<Moment> changedAt_;
    bool wasThere_ = false;     ///< the server, when it was last looked at
    bool hasBeenThere_ = false; ///< in this session
    std::int64_t restarts_ = 0;
    std::int64_t messages_ = 0;
    Dictionary server_; ///< as it was said
    Devices devices_;
};

} // namespace tamblo::pipewire
