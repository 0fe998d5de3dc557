#pragma once

#include "bridge/common/Time.h"
#include "bridge/pipewire/graph/Cycle.h"
#include "bridge/pipewire/graph/Graph.h"
#include "bridge/pipewire/graph/Namespace.h"

#include <chrono>
#include <cstddef>
#include <memory>
#include <optional>
#include <unordered_set>
#include <vector>

namespace tamblo::pipewire {

/// Has the server's profiler tell of each cycle while anything runs.
///
/// The server sends that over a connection of its own, on which nothing waits: it is read once a second,
/// however often the server sends, so that this thread wakes once a second for it while sound runs, and
/// never while none does. When a second brings more than should be kept at once, as with very many streams,
/// the server is asked for only a part of every other second: other cycles are not seen then. The loop's
/// thread.
class Profiler final : public GraphObserver, public Timed {
public:
    static constexpr std::chrono::seconds kInterval{1};
    /// How long the connection is kept when nothing runs any more.
    static constexpr std::chrono::seconds kLinger{5};

    /// How long a server is left alone that has no profiler, or does not answer.
    static constexpr std::chrono::seconds kPause{10};
    /// What should wait to be read at a look, as the library has it all in memory then, and what is too much:
    /// the socket holds some 200 KiB. How short a time the server is asked for that. When so many more nodes
    /// run than at the last look, it is time for one.
    static constexpr std::size_t kGoodAtOnce = 64U << 10U;
    static constexpr std::size_t kMostAtOnce = 128U << 10U;
    static constexpr std::chrono::milliseconds kShortestWindow{20};
    static constexpr std::size_t kManyMore = 32;

    Profiler(const Graph& graph, const Clock& clock, std::vector<CycleObserver*> observers);
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
    void tellRead();
    [[nodiscard]] std::chrono::nanoseconds askOrPause(SteadyTime now);

    const Graph& graph_;
    const Clock& clock_;
    const std::vector<CycleObserver*> observers_;
    std::unordered_set<ObjectID> running_;
    std::optional<SteadyTime> silentSince_;
    std::optional<SteadyTime> due_;
    SteadyTime lookedAt_{};
    std::size_t runningThen_ = 0;
    std::chrono::nanoseconds window_{kInterval}; ///< in which the server is asked
    bool isMissing_ = false;
    std::unique_ptr<Connection> connection_; ///< kept from the first time on that anything runs
};

} // namespace tamblo::pipewire
