#include "bridge/common/StreamSession.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <string_view>
#include <utility>

namespace tamblo::bridge {

namespace {

constexpr EventCategory kSetup = client::category(Subsystem::session, EventKind::setup);
constexpr EventCategory kSession = client::category(Subsystem::session, EventKind::generic);
constexpr EventCategory kRouteChange = client::category(Subsystem::routing, EventKind::routeChange);
constexpr EventCategory kVolume = client::category(EventKind::volume);

constexpr std::array<std::string_view, 4> kVolumeKeys{"linear_volume", "stream_volume", "stream_muted",
                                                      "device_volume"};

/// What has no value yet need not be said; that it has none any more, has.
Dictionary withoutEmpty(const Dictionary& settings) {
    Dictionary rest;
    for (std::size_t i = 0; i < settings.size(); ++i) {
        if (!settings.valueAt(i).isString() || !settings.valueAt(i).stringValue().empty()) {
            rest.set(settings.keyAt(i), settings.valueAt(i));
        }
    }
    return rest;
}

} // namespace

EventCategory StreamSession::ownCategory() const noexcept {
    return client::category(Subsystem::session, kind_.isInput ? EventKind::record : EventKind::playback);
}

void StreamSession::update(const StreamSettings& now, const Moment& at) {
    if (id_ == kNoSession) {
        id_ = reporter_.begin(kind_.serviceType, kind_.application);
        if (id_ == kNoSession) {
            return;
        }
        if (!now.isRunning) {
            say(kSetup, EventType::setup, withoutEmpty(now.settings), at);
        }
    }
    const Dictionary changes = changesBetween(settings_, now.settings);
    const Dictionary before = std::exchange(settings_, now.settings);
    if (now.isRunning && !isRunning()) {
        start(at);
    } else if (!now.isRunning) {
        stopStream(at);
    } else if (changes.contains("active_devices")) {
        Dictionary payload = changes;
        if (const Value* const previous = before.find("active_devices")) {
            payload.set("previous_devices", *previous);
        }
        say(kRouteChange, EventType::generic, std::move(payload), at);
    } else if (!changes.empty()) {
        // While it is muted the volume may be another one that is not heard.
        const bool isVolume = std::ranges::any_of(
            kVolumeKeys, [&changes](std::string_view key) { return changes.contains(key); });
        say(isVolume ? kVolume : ownCategory(), EventType::generic, changes, at);
    }
}

/// Everything is said with the start: what has changed since the last one, and as what is said later in a run
/// would count from its beginning.
void StreamSession::start(const Moment& at) {
    runningSince_ = at;
    Dictionary payload = withoutEmpty(settings_);
    payload.set(kind_.isInput ? "session_input_running" : "session_output_running", true);
    say(ownCategory(), EventType::start, std::move(payload), at);
}

void StreamSession::stop(const Moment& at) {
    const auto length = at.steady - std::exchange(runningSince_, std::nullopt)->steady;
    Dictionary payload{{kind_.isInput ? "session_input_running" : "session_output_running", false}};
    if (kind_.isInput) {
        payload.set("vp_config_primary_vocoder", "none");
        payload.set("vp_config_primary_vocoderFs", "0.0");
    }
    say(ownCategory(), EventType::stop, std::move(payload), at);
    say(kSession, EventType::stop, {{"session_duration", std::chrono::duration<double>(length).count()}}, at);
}

void StreamSession::stopStream(const Moment& at) {
    if (isRunning()) {
        stop(at);
    }
}

void StreamSession::end(const Moment& at) {
    stopStream(at);
    if (id_ != kNoSession) {
        reporter_.end(std::exchange(id_, kNoSession));
    }
}

void StreamSession::forget() {
    id_ = kNoSession;
    runningSince_.reset();
    settings_ = {};
    messages_ = 0;
}

/// The number tells repeated messages apart: the service leaves out one that repeats the last of its kind,
/// though the settings were others in between.
void StreamSession::say(EventCategory category, EventType type, Dictionary payload, const Moment& at) {
    payload.set("message_number", ++messages_);
    reporter_.send(id_, category, type, std::move(payload), at.wall);
}

} // namespace tamblo::bridge
