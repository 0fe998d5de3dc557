#pragma once

#include "bridge/common/Reporter.h"
#include "bridge/common/Time.h"
#include "bridge/pipewire/graph/Cycle.h"
#include "bridge/pipewire/graph/Graph.h"
#include "bridge/pipewire/graph/Namespace.h"
#include "bridge/pipewire/report/SessionOfNode.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

namespace tamblo::pipewire {

/// Reports nodes that did not finish a cycle in time, and devices that ran dry, as overloads: at most one
/// message a second for each node, with their number since the last one. When a node had none for a while,
/// the first is also an error of the audio I/O, which can have the service capture what goes on.
///
/// A node that begins to run is often late for its first cycles, and one that is about to go for its last
/// ones: nobody misses any sound then. So a row of cycles that a node was late for counts when the node has
/// finished one after them, and had finished one before them; or when the row goes on for over a second.
///
/// The cycles of a node are told of up to some seconds later, when it may have gone, and its number been
/// given to another one: they are still counted as its own.
///
/// The loop's thread.
class Overloads final : public CycleObserver, public GraphObserver, public Timed {
public:
    static constexpr std::chrono::seconds kInterval{1};
    static constexpr std::chrono::seconds kCalm{10};
    /// A node that has gone is still reported for so long, if its session lasts.
    static constexpr std::chrono::seconds kAfterEnd{3};
    /// Nodes that have gone and whose numbers others have: each is looked for at each cycle of those. Of
    /// more, the last overloads of the earliest are not reported.
    static constexpr std::size_t kMostReplaced = 64;
    /// A node that has not been told of for so long, by the server's clock, begins to run anew.
    static constexpr std::chrono::nanoseconds kPause{std::chrono::milliseconds(250)};

    Overloads(const Graph& graph, Reporter& reporter, const Clock& clock, SessionOfNode sessionOf)
        : graph_(graph), reporter_(reporter), clock_(clock), sessionOf_(std::move(sessionOf)) {}

    void cycleEnded(const Cycle& cycle) override;
    void cyclesRead() override;
    void graphChanged(const GraphEvent& event) override;
    [[nodiscard]] std::optional<SteadyTime> due() const override { return due_; }
    void run() override;

private:
    /// Cycles in a row that a node was late for.
    struct Row {
        std::uint32_t late = 0;
        std::uint32_t taken = 0; ///< of these, into the tally
        double seconds = 0;      ///< of the others
        bool wasThere = false;   ///< at the last reading
    };
    /// What there is to say of a node.
    struct Tally {
        std::string name;
        std::string application;
        std::uint64_t cycles = 0; ///< since it was first seen
        std::int64_t lastTurn = 0;
        std::int64_t lastTold = 0; ///< the driver's turn
        bool isBeginning = true;
        Row row;
        std::uint32_t counted = 0; ///< from here on, since it was last spoken of
        std::uint32_t late = 0;
        std::uint32_t xruns = 0;
        double worstShare = 0;
        double sumOfShares = 0;
        double secondsLost = 0;
        std::uint32_t frames = 0;
        double cycleSeconds = 0;
        std::optional<std::uint32_t> xrunsOfServer; ///< of a driver, when it was last told of
        std::optional<SteadyTime> saidAt;
        std::optional<SteadyTime> goneAt;
        SessionID session = kNoSession; ///< of one that has gone

        [[nodiscard]] bool hasNews() const noexcept { return late != 0 || xruns != 0; }
    };
    /// What there is to say of a node whose number is another one's now.
    struct Replaced {
        ObjectID node = kNoObject;
        Tally tally;
    };

    void count(Tally& tally, const NodeCycle& node, const Cycle& cycle);
    static void take(Tally& tally, Row& row);
    void ageRow(ObjectID node, Tally& tally) const;
    void reportAll();
    /// Whether that was all that will be said of it.
    bool reportWhenDue(ObjectID node, Tally& tally, const Moment& now);
    void countXruns(Tally& tally, const Cycle& cycle);
    [[nodiscard]] Tally* tallyOf(const NodeCycle& cycle);
    [[nodiscard]] Tally* replacedTallyOf(const NodeCycle& cycle);
    void report(ObjectID node, Tally& tally, const Moment& now);

    const Graph& graph_;
    Reporter& reporter_;
    const Clock& clock_;
    const SessionOfNode sessionOf_;
    std::unordered_map<ObjectID, Tally> tallies_;
    std::vector<Replaced> replaced_; ///< the earliest first
    std::optional<SteadyTime> due_;
    std::int64_t issues_ = 0; ///< tells repeated ones apart, which the service would leave out
};

} // namespace tamblo::pipewire
