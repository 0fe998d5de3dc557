#include "bridge/pipewire/server/Cycles.h"

#include <algorithm>

#include <spa/param/profiler.h>
#include <spa/pod/iter.h>
#include <spa/pod/parser.h>

namespace tamblo::pipewire {

namespace {

/// Nodes of one cycle; the server has no more in its graph either.
constexpr std::size_t kMostNodes = 4096;
/// What a share is cut at: a clock that jumped must not make a mean worthless.
constexpr double kMostShare = 1000;

/// How far a node got, as the server counts it. Later servers have more, which are all out of the cycle.
enum : std::int32_t { kTriggered = 1, kAwake = 2, kFinished = 3 };

/// What is said alike of a driver and of the nodes that follow it. Times are nanoseconds.
struct Block {
    std::int32_t id = 0;
    std::int64_t signalled = 0;
    std::int64_t awake = 0;
    std::int64_t finished = 0;
    std::int32_t status = kFinished;

    [[nodiscard]] bool read(const spa_pod* value) {
        const char* name = nullptr;
        std::int64_t previous = 0;
        return spa_pod_parse_struct(value, SPA_POD_Int(&id), SPA_POD_String(&name), SPA_POD_Long(&previous),
                                    SPA_POD_Long(&signalled), SPA_POD_Long(&awake), SPA_POD_Long(&finished),
                                    SPA_POD_Int(&status)) >= 0;
    }
};

class CycleReader {
public:
    explicit CycleReader(Cycle& cycle) : cycle_(cycle) {}

    /// False for what is no cycle.
    [[nodiscard]] bool read(const spa_pod* object) {
        cycle_ = {.nodes = std::move(cycle_.nodes)};
        cycle_.nodes.clear();
        if (!spa_pod_is_object_type(object, SPA_TYPE_OBJECT_Profiler)) {
            return false;
        }
        const auto* const profile = reinterpret_cast<const spa_pod_object*>(object);
        const spa_pod_prop* property = nullptr;
        SPA_POD_OBJECT_FOREACH(profile, property) {
            take(property->key, &property->value);
        }
        return !cycle_.nodes.empty() && cycle_.nodes.front().node != kNoObject;
    }

private:
    void take(std::uint32_t key, const spa_pod* value) {
        switch (key) {
        case SPA_PROFILER_info: {
            float ignored = 0;
            std::int32_t xruns = 0;
            if (spa_pod_parse_struct(value, SPA_POD_Long(&cycle_.number), SPA_POD_Float(&ignored),
                                     SPA_POD_Float(&ignored), SPA_POD_Float(&ignored),
                                     SPA_POD_Int(&xruns)) >= 0) {
                cycle_.xruns = static_cast<std::uint32_t>(xruns);
            }
            break;
        }
        case SPA_PROFILER_clock:
            takeClock(value);
            break;
        case SPA_PROFILER_driverBlock:
        case SPA_PROFILER_followerBlock:
            takeBlock(value, key == SPA_PROFILER_driverBlock);
            break;
        default:
            break;
        }
    }

    void takeClock(const spa_pod* value) {
        std::int32_t number = 0;
        const char* name = nullptr;
        std::int64_t time = 0;
        std::int64_t position = 0;
        std::int64_t duration = 0;
        spa_fraction rate{};
        if (spa_pod_parse_struct(value, SPA_POD_Int(&number), SPA_POD_Int(&number), SPA_POD_String(&name),
                                 SPA_POD_Long(&time), SPA_POD_Fraction(&rate), SPA_POD_Long(&position),
                                 SPA_POD_Long(&duration)) >= 0 &&
            rate.denom != 0 && duration > 0 && duration <= rate.denom * std::int64_t{60}) {
            cycle_.frames = static_cast<std::uint32_t>(duration);
            cycle_.seconds = static_cast<double>(duration) * rate.num / rate.denom;
        }
    }

    void takeBlock(const spa_pod* value, bool isDriver) {
        Block block;
        if (!block.read(value) || cycle_.nodes.size() >= kMostNodes) {
            return;
        }
        // Followers can be told of without their driver, as one that is about to go: no cycle of theirs.
        if (!isDriver && cycle_.nodes.empty()) {
            cycle_.nodes.emplace_back();
        }
        NodeCycle node{.node = static_cast<ObjectID>(block.id), .turn = block.signalled};
        const bool isLate = block.status == kTriggered || block.status == kAwake;
        node.outcome = isLate                      ? NodeCycle::Outcome::late
                       : block.status == kFinished ? NodeCycle::Outcome::finished
                                                   : NodeCycle::Outcome::waited;
        constexpr double kNanoseconds = 1e-9;
        if (node.outcome == NodeCycle::Outcome::finished && cycle_.seconds > 0) {
            const auto worked = static_cast<double>(block.finished - block.awake) * kNanoseconds;
            node.share = std::clamp(worked / cycle_.seconds, 0.0, kMostShare);
        }
        if (isDriver && !cycle_.nodes.empty()) {
            cycle_.nodes.front() = node;
        } else {
            cycle_.nodes.push_back(node);
        }
    }

    Cycle& cycle_;
};

} // namespace

void readCycles(const spa_pod* profile, std::span<CycleObserver* const> observers) {
    if (profile == nullptr || !spa_pod_is_struct(profile)) {
        return;
    }
    Cycle cycle;
    CycleReader reader(cycle);
    const void* const body = SPA_POD_BODY_CONST(profile);
    const std::uint32_t size = SPA_POD_BODY_SIZE(profile);
    for (auto* item = static_cast<const spa_pod*>(body); spa_pod_is_inside(body, size, item);
         item = static_cast<const spa_pod*>(spa_pod_next(item))) {
        if (!reader.read(item)) {
            continue;
        }
        for (CycleObserver* const observer : observers) {
            observer->cycleEnded(cycle);
        }
    }
}

} // namespace tamblo::pipewire
