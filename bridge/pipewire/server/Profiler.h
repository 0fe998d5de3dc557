#pragma once

#include "bridge/common/Time.h"
#include "bridge/pipewire/graph/Cycle.h"
#include "bridge/pipewire/graph/Graph.h"

#include <chrono>
#include <memory>
#include <optional>
#include <unordered_set>

namespace tamblo::pipewire {

/// Has the server's profiler tell of each cycle while anything runs.
///
/// The server sends that over a connection of its own, on which nothing waits: it is read once a second,
/// however often the server sends, so that this thread wakes once a second for it while sound runs, and
/// never while none does. When a second brings more than is read at once, as with very many streams, the
/// server is not asked for more until that has been read: some cycles are not seen then. The loop's thread.
class Profiler final : public GraphObserver, public Timed {
public:
    static constexpr std::chrono::seconds kInterval{1};
    /// How long the connection is kept when nothing runs any more.
    static constexpr std::chrono::seconds kLinger{5};

    /// How long a server is left alone that has no profiler, or does not answer.
    static constexpr std::chrono::seconds kPause{10};

    Profiler(const Graph& graph, const Clock& clock, CycleObserver& observer);
    ~Profiler() override;
    Profiler(const Profiler&) = delete;
    Profiler& operator=(const Profiler&) = delete;

    void graphChanged(const GraphEvent& event) override;
    [[nodiscard]] std::optional<SteadyTime> due() const override { return due_; }
    void run() override;

private:
    /// The library's state for one connection.
    class Connection;

    void noteRunning(ObjectID node, bool isRunning);
    [[nodiscard]] bool makeConnection();

    const Graph& graph_;
    const Clock& clock_;
    CycleObserver& observer_;
    std::unordered_set<ObjectID> running_;
    std::optional<SteadyTime> silentSince_;
    std::optional<SteadyTime> due_;
    bool isMissing_ = false;
    std::unique_ptr<Connection> connection_; ///< kept from the first time on that anything runs
};

} // namespace tamblo::pipewire
