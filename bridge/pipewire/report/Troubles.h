#pragma once

#include "bridge/common/Reporter.h"
#include "bridge/common/Time.h"
#include "bridge/pipewire/graph/Graph.h"
#include "bridge/pipewire/graph/Namespace.h"
#include "bridge/pipewire/report/SessionOfNode.h"

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <unordered_map>
#include <unordered_set>
#include <vector>

namespace tamblo::pipewire {

/// Reports what goes wrong with streams, apart from overloads, as issues of their sessions: that one stays
/// without a device, that its device vanishes while it runs, and errors of nodes. Of each node at most one
/// error a second is reported, with the number in between.
///
/// What it says of a change it says some time later, when streams have found their way to another device. The
/// loop's thread.
class Troubles final : public GraphObserver, public Timed {
public:
    static constexpr std::chrono::milliseconds kSettling{250};
    /// How long a stream may be without a link.
    static constexpr std::chrono::seconds kPatience{5};
    /// A device may vanish so long after its links, to have been lost with them.
    static constexpr std::chrono::seconds kLinksBefore{1};
    static constexpr std::chrono::seconds kErrorInterval{1};

    Troubles(const Graph& graph, Reporter& reporter, const Clock& clock, SessionOfNode sessionOf)
        : graph_(graph), reporter_(reporter), clock_(clock), sessionOf_(std::move(sessionOf)) {}

    void graphChanged(const GraphEvent& event) override;
    [[nodiscard]] std::optional<SteadyTime> due() const override;
    void run() override;

private:
    struct Stream {
        std::string application;
        bool isRunning = false;
        std::vector<ObjectID> devices; ///< that it reaches
        std::vector<ObjectID> before;  ///< the running stream reached, until then
        std::optional<SteadyTime> movedAt;
        std::optional<SteadyTime> unlinkedSince;
        bool isUnlinkedTold = false;
    };
    struct Vanished {
        ObjectID stream;
        std::string application;
        std::string device;
    };
    struct Errors {
        std::string name;
        std::string application;
        std::string text;
        std::uint32_t seen = 0; ///< as the node counts them
        std::uint32_t told = 0;
        std::optional<SteadyTime> saidAt;
        bool hasGone = false;
    };

    void nodeChanged(ObjectID id, const Node& node);
    void nodeRemoved(ObjectID id, const Node& node);
    void linkChanged(const Link& link);
    void streamChanged(ObjectID stream);
    void deviceVanished(ObjectID device);
    void look(ObjectID id, SteadyTime now);
    void tellVanished(const Moment& now);
    void tellUnlinked(const Moment& now);
    void tellErrors(const Moment& now);
    void tell(ObjectID node, EventCategory category, Dictionary payload, const Moment& now);

    const Graph& graph_;
    Reporter& reporter_;
    const Clock& clock_;
    const SessionOfNode sessionOf_;
    std::unordered_map<ObjectID, Stream> streams_;
    std::unordered_set<ObjectID> changed_;
    std::vector<Vanished> vanished_;
    std::unordered_map<ObjectID, Errors> errors_;
    std::optional<SteadyTime> settlesAt_;
    std::optional<SteadyTime> unlinkedDue_;
    std::optional<SteadyTime> errorsDue_;
    std::int64_t issues_ = 0;
};

} // namespace tamblo::pipewire
