#pragma once

#include "bridge/pipewire/graph/Objects.h"

#include <cstdint>
#include <vector>

namespace tamblo::pipewire {

/// How a node did in one cycle of its driver.
struct NodeCycle {
    enum class Outcome : std::uint8_t {
        finished,
        late,   ///< it was its turn, and it had not finished when the next cycle was due
        waited, ///< it was not its turn, as another one had not finished, or it takes no part
    };

    ObjectID node = kNoObject;
    /// When it was told to begin, in nanoseconds. One that is late may be told of more than once.
    std::int64_t turn = 0;
    Outcome outcome = Outcome::finished;
    double share = 0; ///< of the cycle's time, for which it worked; 0 unless it has finished
};

/// One cycle: the driver has each node that follows it handle so many frames.
struct Cycle {
    std::int64_t number = 0; ///< of the driver's, counted by the server
    std::uint32_t frames = 0;
    double seconds = 0;
    /// How often the driver's device has run dry, or over, since the driver was made.
    std::uint32_t xruns = 0;
    std::vector<NodeCycle> nodes; ///< the driver comes first
};

class CycleObserver {
public:
    virtual ~CycleObserver() = default;
    /// One of many that are told of in a row; the cycle is gone when this returns.
    virtual void cycleEnded(const Cycle& cycle) = 0;
    /// That was all for now.
    virtual void cyclesRead() = 0;
};

} // namespace tamblo::pipewire
