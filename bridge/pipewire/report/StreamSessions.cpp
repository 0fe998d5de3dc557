#include "bridge/pipewire/report/StreamSessions.h"

#include "bridge/pipewire/report/Application.h"
#include "bridge/pipewire/report/StreamSettings.h"

#include <algorithm>
#include <utility>

namespace tamblo::pipewire {

namespace {

bool isStream(const Node& node) noexcept {
    return node.mediaClass == MediaClass::playbackStream || node.mediaClass == MediaClass::captureStream;
}

/// Whether it is an application's, and enough is known of it to report it.
bool isReported(const Node& node) noexcept {
    return isStream(node) && node.isKnown && node.linkGroup.empty() && !node.isMonitor;
}

} // namespace

void StreamSessions::graphChanged(const GraphEvent& event) {
    const bool isRemoved = event.change == GraphEvent::Change::removed;
    if (event.kind == GraphEvent::Kind::node) {
        const Node& node = *graph_.node(event.id);
        if (isStream(node) && isRemoved) {
            streamRemoved(event.id);
        } else if (isReported(node)) {
            streamChanged(event.id);
        } else if (!isStream(node) || !node.linkGroup.empty()) {
            othersChanged();
        }
    } else if (event.kind == GraphEvent::Kind::link) {
        const Link& link = *graph_.link(event.id);
        for (const ObjectID end : {link.output, link.input}) {
            const Node* const node = graph_.node(end);
            if (node != nullptr && isStream(*node) && node->linkGroup.empty()) {
                if (isReported(*node)) {
                    streamChanged(end);
                }
                return;
            }
        }
        othersChanged();
    } else if (event.kind == GraphEvent::Kind::server && graph_.server().version.empty()) {
        endAll();
    } else if (event.kind != GraphEvent::Kind::client) {
        othersChanged();
    }
}

void StreamSessions::streamChanged(ObjectID stream) {
    const Moment now = clock_.now();
    changed_.try_emplace(stream, now);
    if (!settlesAt_) {
        settlesAt_ = now.steady + kSettling;
    }
}

/// A sink's volume, a filter's links: any stream may be concerned.
void StreamSessions::othersChanged() {
    for (const auto& [stream, session] : live_) {
        streamChanged(stream);
    }
}

void StreamSessions::streamRemoved(ObjectID stream) {
    const Moment now = clock_.now();
    // One that came and went within the settling time is reported all the same.
    if (const auto changed = changed_.find(stream); changed != changed_.end()) {
        const Moment since = changed->second;
        changed_.erase(changed);
        if (!live_.contains(stream)) {
            look(stream, since);
        }
    }
    const auto found = live_.find(stream);
    if (found == live_.end()) {
        return;
    }
    found->second.stopStream(now);
    if (found->second.id() != kNoSession) {
        waiting_.push_back({std::move(found->second), stream, now.steady + kGrace});
    }
    live_.erase(found);
}

std::optional<SteadyTime> StreamSessions::due() const {
    if (waiting_.empty()) {
        return settlesAt_;
    }
    return settlesAt_ ? std::min(*settlesAt_, waiting_.front().until) : waiting_.front().until;
}

void StreamSessions::run() {
    const Moment now = clock_.now();
    if (settlesAt_ && *settlesAt_ <= now.steady) {
        settle();
    }
    while (!waiting_.empty() && waiting_.front().until <= now.steady) {
        waiting_.front().session.end(now);
        waiting_.pop_front();
    }
}

void StreamSessions::settle() {
    settlesAt_.reset();
    for (const auto& [stream, at] : std::exchange(changed_, {})) {
        look(stream, at);
    }
}

void StreamSessions::look(ObjectID stream, const Moment& at) {
    const Node* const node = graph_.node(stream);
    StreamSession* const session = node != nullptr && isReported(*node) ? sessionFor(stream) : nullptr;
    if (session != nullptr) {
        session->update(settingsOf(graph_, stream), at);
    }
}

StreamKind StreamSessions::kindOf(const Node& stream) const {
    std::string application = applicationOf(stream, graph_.client(stream.client));
    const ServiceType serviceType = types_.of(stream.role, application);
    return {std::move(application), serviceType, stream.mediaClass == MediaClass::captureStream};
}

StreamSession* StreamSessions::sessionFor(ObjectID stream) {
    if (const auto found = live_.find(stream); found != live_.end()) {
        return &found->second;
    }
    const StreamKind kind = kindOf(*graph_.node(stream));
    // The one that ended last: a player that goes on, rather than one that was closed before.
    const auto last = std::find_if(waiting_.rbegin(), waiting_.rend(), [&kind](const Waiting& waiting) {
        return waiting.session.kind() == kind;
    });
    if (last != waiting_.rend()) {
        const auto place = std::prev(last.base());
        StreamSession& session = live_.emplace(stream, std::move(place->session)).first->second;
        waiting_.erase(place);
        return &session;
    }
    if (count() >= kMostSessions && !waiting_.empty()) {
        waiting_.front().session.end(clock_.now());
        waiting_.pop_front();
    }
    if (count() >= kMostSessions) {
        ++leftOut_;
        return nullptr;
    }
    return &live_.emplace(stream, StreamSession(reporter_, kind)).first->second;
}

void StreamSessions::reporterCame() {
    for (const auto& [stream, session] : live_) {
        streamChanged(stream);
    }
}

void StreamSessions::reporterWent() {
    waiting_.clear();
    for (auto& [stream, session] : live_) {
        session.forget();
    }
}

void StreamSessions::endAll() {
    const Moment now = clock_.now();
    for (Waiting& waiting : waiting_) {
        waiting.session.end(now);
    }
    for (auto& [stream, session] : live_) {
        session.end(now);
    }
    waiting_.clear();
    live_.clear();
    changed_.clear();
    settlesAt_.reset();
}

SessionID StreamSessions::sessionOf(ObjectID stream) const noexcept {
    if (const auto found = live_.find(stream); found != live_.end()) {
        return found->second.id();
    }
    const auto ended = std::find_if(waiting_.rbegin(), waiting_.rend(),
                                    [stream](const Waiting& waiting) { return waiting.stream == stream; });
    return ended == waiting_.rend() ? kNoSession : ended->session.id();
}

} // namespace tamblo::pipewire
