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
    const std::optional<SteadyTime> ofPool = pool_.due();
    return settlesAt_ && ofPool ? std::min(*settlesAt_, *ofPool) : settlesAt_ ? settlesAt_ : ofPool;
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
    if (node == nullptr || !isReported(*node)) {
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
