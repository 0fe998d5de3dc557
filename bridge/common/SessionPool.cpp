#include "bridge/common/SessionPool.h"

#include <algorithm>
#include <iterator>
#include <utility>

namespace tamblo::bridge {

StreamSession* SessionPool::find(Key stream) {
    const auto found = live_.find(stream);
    return found == live_.end() ? nullptr : &found->second;
}

StreamSession* SessionPool::sessionFor(Key stream, const StreamKind& kind) {
    if (StreamSession* const known = find(stream)) {
        return known;
    }
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

void SessionPool::leave(Key stream, const Moment& at) {
    const auto found = live_.find(stream);
    if (found == live_.end()) {
        return;
    }
    found->second.stopStream(at);
    if (found->second.id() != kNoSession) {
        waiting_.push_back({std::move(found->second), stream, clock_.now().steady + kGrace});
    }
    live_.erase(found);
}

std::optional<SteadyTime> SessionPool::due() const {
    return waiting_.empty() ? std::nullopt : std::optional(waiting_.front().until);
}

void SessionPool::run() {
    const Moment now = clock_.now();
    while (!waiting_.empty() && waiting_.front().until <= now.steady) {
        waiting_.front().session.end(now);
        waiting_.pop_front();
    }
}

void SessionPool::forget() {
    waiting_.clear();
    for (auto& [stream, session] : live_) {
        session.forget();
    }
}

void SessionPool::endAll() {
    const Moment now = clock_.now();
    for (Waiting& waiting : waiting_) {
        waiting.session.end(now);
    }
    for (auto& [stream, session] : live_) {
        session.end(now);
    }
    waiting_.clear();
    live_.clear();
}

SessionID SessionPool::idOf(Key stream) const noexcept {
    if (const auto found = live_.find(stream); found != live_.end()) {
        return found->second.id();
    }
    const auto ended = std::find_if(waiting_.rbegin(), waiting_.rend(),
                                    [stream](const Waiting& waiting) { return waiting.stream == stream; });
    return ended == waiting_.rend() ? kNoSession : ended->session.id();
}

} // namespace tamblo::bridge
