#include "bridge/pipewire/report/Overloads.h"

#include "bridge/pipewire/graph/Routes.h"
#include "bridge/pipewire/report/Application.h"

#include <algorithm>
#include <cmath>
#include <ratio>
#include <utility>

namespace tamblo::pipewire {

namespace {

constexpr EventCategory kIO = client::category(EventKind::io);

/// A driver that begins its next cycle when only so much of one has passed begins anew, as when a stream
/// comes to others that run: those were not given the time that they are due.
constexpr double kEarly = 0.75;

double roundedShare(double value) noexcept {
    constexpr double kDigits = 1e3;
    return std::round(value * kDigits) / kDigits;
}

} // namespace

void Overloads::cycleEnded(const Cycle& cycle) {
    for (std::size_t i = 0; i < cycle.nodes.size(); ++i) {
        Tally* const tally = tallyOf(cycle.nodes[i]);
        if (tally == nullptr) {
            continue;
        }
        count(*tally, cycle.nodes[i], cycle);
        if (i == 0) {
            countXruns(*tally, cycle);
        }
    }
}

/// One that the graph has not, or not yet, cannot be reported.
Overloads::Tally* Overloads::tallyOf(const NodeCycle& cycle) {
    if (Tally* const replaced = replacedTallyOf(cycle); replaced != nullptr) {
        return replaced;
    }
    const ObjectID node = cycle.node;
    if (const auto found = tallies_.find(node); found != tallies_.end()) {
        return &found->second;
    }
    const Node* const known = graph_.node(node);
    if (known == nullptr) {
        return nullptr;
    }
    Tally tally;
    tally.application =
        known->isDevice() ? std::string() : applicationOf(*known, graph_.client(known->client));
    tally.name = known->isDevice()   ? factsOf(graph_, node).name
                 : known->isStream() ? tally.application
                                     : filterName(*known);
    return &tallies_.emplace(node, std::move(tally)).first->second;
}

Overloads::Tally* Overloads::replacedTallyOf(const NodeCycle& cycle) {
    const SteadyTime turn{std::chrono::nanoseconds(cycle.turn)};
    const auto found = std::ranges::find_if(replaced_, [&cycle, turn](const Replaced& replaced) {
        return replaced.node == cycle.node && turn <= replaced.tally.goneAt;
    });
    return found == replaced_.end() ? nullptr : &found->tally;
}

void Overloads::count(Tally& tally, const NodeCycle& node, const Cycle& cycle) {
    tally.frames = cycle.frames;
    tally.cycleSeconds = cycle.seconds;
    const std::int64_t now = cycle.nodes.front().turn;
    const auto passed = static_cast<double>(now - tally.lastTold);
    const bool isEarly = passed > 0 && passed < kEarly * cycle.seconds * std::nano::den;
    if (isEarly || passed > static_cast<double>(kPause.count())) {
        tally.isBeginning = true;
    }
    tally.lastTold = now;
    if (node.outcome == NodeCycle::Outcome::waited || (tally.cycles != 0 && tally.lastTurn == node.turn)) {
        return;
    }
    ++tally.cycles;
    tally.lastTurn = node.turn;
    if (node.outcome == NodeCycle::Outcome::late) {
        ++tally.row.late;
        tally.row.seconds += cycle.seconds;
        return;
    }
    Row row = std::exchange(tally.row, {});
    if (!std::exchange(tally.isBeginning, false)) {
        take(tally, row);
    }
    ++tally.counted;
    tally.sumOfShares += node.share;
    tally.worstShare = std::max(tally.worstShare, node.share);
}

/// In each of them the node has worked since the first.
void Overloads::take(Tally& tally, Row& row) {
    for (; row.taken < row.late; ++row.taken) {
        const double share = row.taken + 1;
        ++tally.late;
        ++tally.counted;
        tally.sumOfShares += share;
        tally.worstShare = std::max(tally.worstShare, share);
    }
    tally.secondsLost += std::exchange(row.seconds, 0);
}

/// A row that the last reading ended with, and this one, too, is one of a node that hangs.
void Overloads::ageRow(ObjectID node, Tally& tally) const {
    const Node* const known = tally.goneAt ? nullptr : graph_.node(node);
    if (known == nullptr || known->state != NodeState::running) {
        tally.row = {};
    } else if (tally.row.wasThere) {
        take(tally, tally.row);
        tally.isBeginning = false;
    } else {
        tally.row.wasThere = tally.row.late != 0;
    }
}

/// The server counts them from the driver's beginning, as long as the driver's number of xruns does not fall.
void Overloads::countXruns(Tally& tally, const Cycle& cycle) {
    const std::uint32_t before = tally.xrunsOfServer.value_or(cycle.xruns);
    if (cycle.xruns > before) {
        tally.xruns += cycle.xruns - before;
        tally.secondsLost += (cycle.xruns - before) * cycle.seconds;
    }
    tally.xrunsOfServer = cycle.xruns;
}

void Overloads::cyclesRead() {
    for (auto& [node, tally] : tallies_) {
        ageRow(node, tally);
    }
    for (Replaced& replaced : replaced_) {
        ageRow(replaced.node, replaced.tally);
    }
    reportAll();
}

void Overloads::reportAll() {
    const Moment now = clock_.now();
    due_.reset();
    for (auto entry = tallies_.begin(); entry != tallies_.end();) {
        const bool isOver = reportWhenDue(entry->first, entry->second, now);
        entry = isOver ? tallies_.erase(entry) : std::next(entry);
    }
    for (auto entry = replaced_.begin(); entry != replaced_.end();) {
        const bool isOver = reportWhenDue(entry->node, entry->tally, now);
        entry = isOver ? replaced_.erase(entry) : std::next(entry);
    }
}

bool Overloads::reportWhenDue(ObjectID node, Tally& tally, const Moment& now) {
    if (tally.hasNews() && tally.saidAt && now.steady - *tally.saidAt < kInterval) {
        bringForward(due_, *tally.saidAt + kInterval);
    } else {
        report(node, tally, now);
    }
    return tally.goneAt && now.steady - *tally.goneAt >= kAfterEnd;
}

void Overloads::run() {
    reportAll();
}

/// The server's numbers go to other objects when theirs have gone.
void Overloads::graphChanged(const GraphEvent& event) {
    if (event.kind != GraphEvent::Kind::node) {
        return;
    }
    const auto found = tallies_.find(event.id);
    if (found == tallies_.end()) {
        return;
    }
    Tally& tally = found->second;
    if (event.change == GraphEvent::Change::removed) {
        tally.goneAt = clock_.now().steady;
        tally.session = sessionOf_(event.id);
    } else if (event.change == GraphEvent::Change::added) {
        if (replaced_.size() == kMostReplaced) {
            replaced_.erase(replaced_.begin());
        }
        replaced_.push_back({.node = event.id, .tally = std::move(tally)});
        tallies_.erase(found);
    }
}

void Overloads::report(ObjectID node, Tally& tally, const Moment& now) {
    const SessionID session = !tally.hasNews() ? kNoSession : tally.goneAt ? tally.session : sessionOf_(node);
    if (session != kNoSession) {
        const double mean = tally.counted == 0 ? 0 : tally.sumOfShares / tally.counted;
        Dictionary payload{{"node", tally.name},
                           {"overload_number", tally.late + tally.xruns},
                           {"late_number", tally.late},
                           {"xrun_number", tally.xruns},
                           {"cycle_share", roundedShare(tally.worstShare)},
                           {"mean_cycle_share", roundedShare(mean)},
                           {"io_buffer_size", tally.frames},
                           {"cycle_seconds", tally.cycleSeconds},
                           {"smallest_buffer_frame_size", tally.frames},
                           {"cycle_number", tally.counted},
                           {"io_cycle", tally.cycles},
                           {"issue_number", ++issues_}};
        if (!tally.saidAt || now.steady - *tally.saidAt >= kCalm) {
            reporter_.send(session, kIO, EventType::error, payload, now.wall);
        }
        payload.set("issue_type", "overload");
        payload.set("rtaid_client", tally.application);
        payload.set("any_channel_silence_seconds", tally.secondsLost);
        reporter_.send(session, kIO, EventType::issueDetector, std::move(payload), now.wall);
        tally.saidAt = now.steady;
    }
    tally.counted = tally.late = tally.xruns = 0;
    tally.worstShare = tally.sumOfShares = tally.secondsLost = 0;
}

} // namespace tamblo::pipewire
