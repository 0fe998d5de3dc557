#include "bridge/pipewire/report/StreamSessions.h"

#include "bridge/pipewire/report/Application.h"
#include "bridge/pipewire/report/StreamSettings.h"

#include <utility>

namespace tamblo::pipewire {

void StreamSessions::graphChanged(const GraphEvent& event) {
    const bool isRemoved = event.change == GraphEvent::Change::removed;
    if (event.kind == GraphEvent::Kind::node) {
        const Node& node = *graph_.node(event.id);
        if (node.isStream() && isRemoved) {
            streamRemoved(event.id);
        } else if (node.isReported()) {
            streamChanged(event.id);
        } else if (!node.isStream() || !node.linkGroup.empty()) {
            othersChanged();
        }
    } else if (event.kind == GraphEvent::Kind::link) {
        const Link& link = *graph_.link(event.id);
        for (const ObjectID end : {link.output, link.input}) {
            const Node* const node = graph_.node(end);
            if (node != nullptr && node->isStream() && node->linkGroup.empty()) {
                if (node->isReported()) {
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
    for (const auto& [stream, session] : pool_.live()) {
        streamChanged(static_cast<ObjectID>(stream));
    }
}

void StreamSessions::streamRemoved(ObjectID stream) {
    // One that came and went within the settling time is reported all the same.
    if (const auto changed = changed_.find(stream); changed != changed_.end()) {
        const Moment since = changed->second;
        changed_.erase(changed);
        if (!pool_.contains(stream)) {
            look(stream, since);
        }
    }
    pool_.leave(stream, clock_.now());
}

std::optional<SteadyTime> StreamSessions::due() const {
    std::optional<SteadyTime> due = settlesAt_;
    bringForward(due, pool_.due());
    return due;
}

void StreamSessions::run() {
    if (settlesAt_ && *settlesAt_ <= clock_.now().steady) {
        settle();
    }
    pool_.run();
}

void StreamSessions::settle() {
    settlesAt_.reset();
    for (const auto& [stream, at] : std::exchange(changed_, {})) {
        look(stream, at);
    }
}

void StreamSessions::look(ObjectID stream, const Moment& at) {
    const Node* const node = graph_.node(stream);
    if (node == nullptr || !node->isReported()) {
        return;
    }
    StreamSession* const known = pool_.find(stream);
    StreamSession* const session = known != nullptr ? known : pool_.sessionFor(stream, kindOf(*node));
    if (session != nullptr) {
        session->update(settingsOf(graph_, stream), at);
    }
}

StreamKind StreamSessions::kindOf(const Node& stream) const {
    std::string application = applicationOf(stream, graph_.client(stream.client));
    const ServiceType serviceType = types_.of(stream.role, application);
    return {std::move(application), serviceType, stream.mediaClass == MediaClass::captureStream};
}

void StreamSessions::reporterCame() {
    othersChanged();
}

void StreamSessions::reporterWent() {
    pool_.forget();
}

void StreamSessions::endAll() {
    pool_.endAll();
    changed_.clear();
    settlesAt_.reset();
}

} // namespace tamblo::pipewire
