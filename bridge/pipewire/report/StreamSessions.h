#pragma once

#include "bridge/common/Reporter.h"
#include "bridge/common/ServiceTypes.h"
#include "bridge/common/SessionPool.h"
#include "bridge/common/Time.h"
#include "bridge/pipewire/graph/Graph.h"
#include "bridge/pipewire/graph/Namespace.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <unordered_map>

namespace tamblo::pipewire {

/// Which sessions there are: one for each application's stream that is no filter's side and no level meter.
///
/// Changes of the graph come in swarms: a stream that is moved loses links and gets others, one after
/// another. So the first change has the stream looked at a settling time later, and what it is like then is
/// reported with the time of that first change. A stream's end is reported at once. Its session waits a grace
/// time for another stream of the same application, direction and service type, and goes on with that.
///
/// The loop's thread.
class StreamSessions final : public GraphObserver, public ReporterListener, public Timed {
public:
    static constexpr std::chrono::milliseconds kSettling{60};
    static constexpr std::chrono::seconds kGrace = SessionPool::kGrace;
    static constexpr std::size_t kMostSessions = SessionPool::kMostSessions;

    StreamSessions(const Graph& graph, Reporter& reporter, const Clock& clock, const ServiceTypes& types)
        : graph_(graph), clock_(clock), types_(types), pool_(reporter, clock) {}

    void graphChanged(const GraphEvent& event) override;
    void reporterCame() override;
    void reporterWent() override;
    [[nodiscard]] std::optional<SteadyTime> due() const override;
    void run() override;

    /// Looks at everything that has changed without waiting for it to settle.
    void settle();
    /// Ends all sessions, those in their grace time, too: this program goes. When the sound server has gone,
    /// that is done without being asked for.
    void endAll();

    /// A stream's session, to report of it what goes wrong, or has gone wrong just before its end;
    /// `kNoSession` while there is none.
    [[nodiscard]] SessionID sessionOf(ObjectID stream) const noexcept { return pool_.idOf(stream); }
    [[nodiscard]] std::size_t count() const noexcept { return pool_.count(); }
    /// How often a stream was not reported, as there were too many.
    [[nodiscard]] std::uint64_t leftOut() const noexcept { return pool_.leftOut(); }

private:
    void streamChanged(ObjectID stream);
    void streamRemoved(ObjectID stream);
    void othersChanged();
    void look(ObjectID stream, const Moment& at);
    [[nodiscard]] StreamKind kindOf(const Node& stream) const;

    const Graph& graph_;
    const Clock& clock_;
    const ServiceTypes& types_;
    SessionPool pool_;
    /// The streams that have changed, each with the time of its first change.
    std::unordered_map<ObjectID, Moment> changed_;
    std::optional<SteadyTime> settlesAt_;
};

} // namespace tamblo::pipewire
