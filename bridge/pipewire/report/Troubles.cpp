#include "bridge/pipewire/report/Troubles.h"

#include "bridge/pipewire/graph/Routes.h"
#include "bridge/pipewire/report/Application.h"

#include <algorithm>
#include <utility>

namespace tamblo::pipewire {

namespace {

constexpr EventCategory kRouting = client::category(Subsystem::routing, EventKind::error);
constexpr EventCategory kError = client::category(EventKind::error);

/// An application's, that is heard or hears: no side of a filter, and no level meter.
bool isWatched(const Node& node) noexcept {
    return node.isStream() && node.isKnown && node.linkGroup.empty() && !node.isMonitor;
}

bool holds(const std::vector<ObjectID>& ids, ObjectID id) noexcept {
    return std::find(ids.begin(), ids.end(), id) != ids.end();
}

} // namespace

void Troubles::graphChanged(const GraphEvent& event) {
    const bool isRemoved = event.change == GraphEvent::Change::removed;
    if (event.kind == GraphEvent::Kind::node) {
        const Node& node = *graph_.node(event.id);
        if (isRemoved) {
            nodeRemoved(event.id, node);
        } else {
            if (event.change == GraphEvent::Change::added) {
                // The number was another one's before.
                errors_.erase(event.id);
            }
            nodeChanged(event.id, node);
        }
    } else if (event.kind == GraphEvent::Kind::link) {
        linkChanged(*graph_.link(event.id));
    } else if (event.kind == GraphEvent::Kind::server && graph_.server().version.empty()) {
        // All that vanished did so with the server.
        streams_.clear();
        changed_.clear();
        vanished_.clear();
        errors_.clear();
        settlesAt_ = unlinkedDue_ = errorsDue_ = std::nullopt;
    }
}

void Troubles::nodeChanged(ObjectID id, const Node& node) {
    if (isWatched(node)) {
        streamChanged(id);
    }
    const auto known = errors_.find(id);
    if (node.errors == (known == errors_.end() ? 0 : known->second.seen)) {
        return;
    }
    Errors& errors = errors_[id];
    errors.seen = node.errors;
    if (node.isStream()) {
        // What an application says of its error may name what it plays.
        errors.application = applicationOf(node, graph_.client(node.client));
        errors.name = errors.application;
    } else {
        errors.name = node.isDevice() ? factsOf(graph_, id).name : filterName(node);
        errors.text = node.error;
    }
    const SteadyTime now = clock_.now().steady;
    bringForward(errorsDue_, errors.saidAt ? std::max(now + kSettling, *errors.saidAt + kErrorInterval)
                                           : now + kSettling);
}

void Troubles::nodeRemoved(ObjectID id, const Node& node) {
    streams_.erase(id);
    changed_.erase(id);
    if (node.isDevice()) {
        deviceVanished(id);
    }
    const auto errors = errors_.find(id);
    if (errors != errors_.end()) {
        errors->second.hasGone = true;
        bringForward(errorsDue_, clock_.now().steady + kErrorInterval);
    }
}

void Troubles::linkChanged(const Link& link) {
    for (const ObjectID end : {link.output, link.input}) {
        const Node* const node = graph_.node(end);
        if (node != nullptr && isWatched(*node)) {
            streamChanged(end);
            return;
        }
    }
    // One between filters: any stream may be concerned.
    for (const auto& [stream, state] : streams_) {
        streamChanged(stream);
    }
}

void Troubles::streamChanged(ObjectID stream) {
    changed_.insert(stream);
    if (!settlesAt_) {
        settlesAt_ = clock_.now().steady + kSettling;
    }
}

/// Its links may have gone before it, and then some time may have passed, in which the streams were looked
/// at.
void Troubles::deviceVanished(ObjectID device) {
    const SteadyTime now = clock_.now().steady;
    std::string name;
    for (auto& [id, stream] : streams_) {
        const bool hadIt = stream.isRunning && holds(stream.devices, device);
        const bool hadItJustNow =
            stream.movedAt && now - *stream.movedAt < kLinksBefore && holds(stream.before, device);
        if (hadIt || hadItJustNow) {
            name = name.empty() ? factsOf(graph_, device).name : name;
            vanished_.push_back({id, stream.application, name});
            streamChanged(id);
        }
    }
}

std::optional<SteadyTime> Troubles::due() const {
    std::optional<SteadyTime> due = settlesAt_;
    for (const auto& time : {unlinkedDue_, errorsDue_}) {
        bringForward(due, time);
    }
    return due;
}

void Troubles::run() {
    const Moment now = clock_.now();
    if (settlesAt_ && *settlesAt_ <= now.steady) {
        settlesAt_.reset();
        for (const ObjectID stream : std::exchange(changed_, {})) {
            look(stream, now.steady);
        }
        tellVanished(now);
    }
    if (unlinkedDue_ && *unlinkedDue_ <= now.steady) {
        tellUnlinked(now);
    }
    if (errorsDue_ && *errorsDue_ <= now.steady) {
        tellErrors(now);
    }
}

void Troubles::look(ObjectID id, SteadyTime now) {
    const Node* const node = graph_.node(id);
    if (node == nullptr || !isWatched(*node)) {
        return;
    }
    Reached reached = devicesReachedFrom(graph_, id);
    Stream& stream = streams_[id];
    if (stream.isRunning && reached.devices != stream.devices) {
        stream.before = stream.devices;
        stream.movedAt = now;
    }
    stream.application = applicationOf(*node, graph_.client(node->client));
    stream.devices = std::move(reached.devices);
    stream.isRunning = node->state == NodeState::running && reached.isLinked;
    if (reached.isLinked) {
        stream.unlinkedSince.reset();
        stream.isUnlinkedTold = false;
    } else if (!stream.unlinkedSince) {
        stream.unlinkedSince = now;
        bringForward(unlinkedDue_, now + kPatience);
    }
}

void Troubles::tellVanished(const Moment& now) {
    for (const Vanished& loss : std::exchange(vanished_, {})) {
        const auto stream = streams_.find(loss.stream);
        if (stream == streams_.end()) {
            continue;
        }
        const bool isLinked = !stream->second.unlinkedSince;
        const double silence = isLinked ? 0.0 : std::chrono::duration<double>(kSettling).count();
        tell(loss.stream, kRouting,
             {{"issue_type", "device_vanished"},
              {"rtaid_client", loss.application},
              {"node", loss.device},
              {"has_other_device", isLinked},
              {"any_channel_silence_seconds", silence}},
             now);
    }
}

void Troubles::tellUnlinked(const Moment& now) {
    unlinkedDue_.reset();
    for (auto& [id, stream] : streams_) {
        if (!stream.unlinkedSince || stream.isUnlinkedTold) {
            continue;
        }
        const SteadyTime due = *stream.unlinkedSince + kPatience;
        if (due > now.steady) {
            bringForward(unlinkedDue_, due);
            continue;
        }
        stream.isUnlinkedTold = true;
        const double seconds = std::chrono::duration<double>(now.steady - *stream.unlinkedSince).count();
        tell(id, kRouting,
             {{"issue_type", "no_device"},
              {"rtaid_client", stream.application},
              {"node", stream.application},
              {"any_channel_silence_seconds", seconds}},
             now);
    }
}

void Troubles::tellErrors(const Moment& now) {
    errorsDue_.reset();
    for (auto entry = errors_.begin(); entry != errors_.end();) {
        auto& [id, errors] = *entry;
        const bool hasNews = errors.seen > errors.told;
        const bool isEarly = errors.saidAt && now.steady - *errors.saidAt < kErrorInterval;
        if (hasNews && isEarly) {
            bringForward(errorsDue_, *errors.saidAt + kErrorInterval);
        } else if (hasNews) {
            Dictionary payload{{"issue_type", "node_error"},
                               {"rtaid_client", errors.application},
                               {"node", errors.name},
                               {"error_number", errors.seen - errors.told},
                               {"any_channel_silence_seconds", 0.0}};
            if (!errors.text.empty()) {
                payload.set("error", errors.text);
            }
            errors.told = errors.seen;
            errors.saidAt = now.steady;
            tell(id, kError, std::move(payload), now);
        }
        const bool isOver = errors.hasGone && errors.seen == errors.told;
        entry = isOver ? errors_.erase(entry) : std::next(entry);
    }
}

void Troubles::tell(ObjectID node, EventCategory category, Dictionary payload, const Moment& now) {
    if (const SessionID session = sessionOf_(node); session != kNoSession) {
        // Tells repeated ones apart, which the service would leave out.
        payload.set("issue_number", ++issues_);
        reporter_.send(session, category, EventType::issueDetector, std::move(payload), now.wall);
    }
}

} // namespace tamblo::pipewire
