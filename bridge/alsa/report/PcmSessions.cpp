#include "bridge/alsa/report/PcmSessions.h"

#include "bridge/alsa/report/PcmSettings.h"

#include <algorithm>
#include <array>
#include <set>
#include <utility>

namespace tamblo::alsa {

using bridge::Moment;
using bridge::SteadyTime;

namespace {

constexpr bridge::EventCategory kRouting =
    client::category(bridge::Subsystem::routing, bridge::EventKind::error);

bridge::SessionPool::Key keyOf(const Owner& owner, bool isInput) noexcept {
    return static_cast<bridge::SessionPool::Key>(owner.process) << 1U | (isInput ? 1U : 0U);
}

Moment earlier(const Moment& moment, std::chrono::nanoseconds age) noexcept {
    return {moment.steady - std::chrono::duration_cast<SteadyTime::duration>(age),
            moment.wall - std::chrono::duration_cast<bridge::WallTime::duration>(age)};
}

} // namespace

PcmSessions::PcmSessions(const SoundFiles& files, Mixers& mixers, bridge::Reporter& reporter,
                         const bridge::Clock& clock, const bridge::ServiceTypes& types)
    : files_(files),
      mixers_(mixers),
      reporter_(reporter),
      clock_(clock),
      types_(types),
      pool_(reporter, clock),
      xruns_(reporter, clock, pool_) {}

void PcmSessions::nodeTouched(std::optional<std::string_view> node) {
    const std::optional<PcmName> device = node ? deviceOfNode(*node) : std::nullopt;
    if (node && !device) {
        return;
    }
    // Those that are open may have lost their files.
    const std::vector<PcmName> there = device ? files_.ofDevice(*device) : files_.all();
    std::set<PcmName> names(there.begin(), there.end());
    for (const auto& [name, pcm] : open_) {
        if (!device || name.isOfSameDevice(*device)) {
            names.insert(name);
        }
    }
    for (const PcmName& name : names) {
        look(name, true);
    }
    lookAgain();
}

/// What was opened begins to run soon. And the kernel tells of a close before it carries it out, so that what
/// was closed may have looked open yet.
void PcmSessions::lookAgain() {
    if (!open_.empty()) {
        bridge::bringForward(nextLook_, clock_.now().steady + kSecondLook);
    }
}

/// `isTouched` says that it may have been closed and opened again since the last look.
void PcmSessions::look(const PcmName& name, bool isTouched) {
    const std::optional<PcmStatus> status = files_.status(name);
    const Moment now = clock_.now();
    const auto known = open_.find(name);
    if (!status) {
        if (known != open_.end() && !files_.exists(name)) {
            vanished(name, now);
        }
        return;
    }
    if (known == open_.end()) {
        if (status->state != PcmState::closed) {
            opened(name, *status, now);
        }
        return;
    }
    const PcmStatus& before = known->second.status;
    const bool isAnother = status->owner != before.owner ||
                           (isTouched && before.trigger.count() != 0 && before.trigger != status->trigger);
    if (status->state == PcmState::closed) {
        closed(name, now);
    } else if (isAnother) {
        closed(name, now);
        opened(name, *status, now);
    } else {
        changed(name, known->second, *status, now);
    }
}

void PcmSessions::opened(const PcmName& name, const PcmStatus& status, const Moment& now) {
    if (open_.size() >= kMostOpen) {
        return;
    }
    OpenPcm pcm{.owner = files_.ownerOf(status.owner),
                .device = files_.nameOf(name),
                .status = {.state = PcmState::idle, .owner = status.owner},
                .format = {},
                .lookedAt = now,
                .changedAt = now};
    OpenPcm& added = open_.emplace(name, std::move(pcm)).first->second;
    changed(name, added, status, now);
}

void PcmSessions::changed(const PcmName& name, OpenPcm& pcm, const PcmStatus& status, const Moment& now) {
    const bool hasNewState = status.state != pcm.status.state || status.trigger != pcm.status.trigger;
    bool hasNews = hasNewState;
    if (hasNewState || !pcm.format) {
        const auto format = std::exchange(pcm.format, files_.format(name));
        hasNews = hasNews || format != pcm.format;
    }
    const bool wasRunning = pcm.status.isRunning();
    const Moment trigger = lastTrigger(pcm, status, now);
    const bool isXrun = status.state == PcmState::xrun;
    const double silence = isXrun ? std::chrono::duration<double>(now.steady - trigger.steady).count() : 0;
    const PcmStatus before = std::exchange(pcm.status, status);
    const Key session = keyOf(pcm.owner, name.isInput);
    if (hasNewState) {
        pcm.changedAt = now;
    }
    if (hasNews || !pool_.contains(session)) {
        update(session, wasRunning != status.isRunning() ? trigger : now);
    }
    if (const XrunCount count = xrunsBetween(before, status, pcm.format.value_or(PcmFormat{}));
        count.xruns + count.restarts != 0) {
        xruns_.count(name, {session, pcm.owner.application, pcm.device}, count, silence,
                     pcm.format.value_or(PcmFormat{}), status.position);
    }
    pcm.lookedAt = now;
}

/// When it was started or stopped, as far as that was since the last look: by how long before the writing of
/// its status that was or, when the kernel did not write when that was, by whichever clock makes sense.
Moment PcmSessions::lastTrigger(const OpenPcm& pcm, const PcmStatus& status, const Moment& now) const {
    using std::chrono::nanoseconds;
    const auto longest = std::chrono::duration_cast<nanoseconds>(now.steady - pcm.lookedAt.steady);
    if (status.isRunning() && status.written >= status.trigger && status.trigger.count() != 0) {
        return earlier(now, std::min(status.written - status.trigger, longest));
    }
    for (const nanoseconds clock :
         {nanoseconds(now.wall.time_since_epoch()), nanoseconds(now.steady.time_since_epoch())}) {
        const nanoseconds age = clock - status.trigger;
        if (age.count() >= 0 && age <= longest) {
            return earlier(now, age);
        }
    }
    return now;
}

void PcmSessions::closed(const PcmName& name, const Moment& now) {
    const auto found = open_.find(name);
    const Key session = keyOf(found->second.owner, name.isInput);
    open_.erase(found);
    const bool isLastOfSession = std::ranges::none_of(
        open_, [&](const auto& entry) { return keyOf(entry.second.owner, entry.first.isInput) == session; });
    if (isLastOfSession) {
        pool_.leave(session, now);
    } else {
        update(session, now);
    }
    if (std::ranges::none_of(open_, [&](const auto& entry) { return entry.first.card == name.card; })) {
        cards_.erase(name.card);
    }
    if (open_.empty()) {
        nextLook_.reset();
    }
}

void PcmSessions::vanished(const PcmName& name, const Moment& now) {
    const OpenPcm lost = open_.at(name);
    closed(name, now);
    if (!lost.status.isRunning()) {
        return;
    }
    const Key session = keyOf(lost.owner, name.isInput);
    const bridge::StreamSession* const left = pool_.find(session);
    reporter_.send(pool_.idOf(session), kRouting, bridge::EventType::issueDetector,
                   {{"issue_type", "device_vanished"},
                    {"rtaid_client", lost.owner.application},
                    {"node", lost.device},
                    {"has_other_device", left != nullptr && left->isRunning()},
                    {"any_channel_silence_seconds", 0.0},
                    {"issue_number", ++issues_}},
                   now.wall);
}

void PcmSessions::update(Key session, const Moment& at) {
    const auto first = std::ranges::find_if(open_, [session](const auto& entry) {
        return keyOf(entry.second.owner, entry.first.isInput) == session;
    });
    const std::string& application = first->second.owner.application;
    bridge::StreamSession* const known = pool_.find(session);
    bridge::StreamSession* const said =
        known != nullptr
            ? known
            : pool_.sessionFor(session, {application, types_.of("", application), first->first.isInput});
    if (said != nullptr) {
        said->update(settingsOf(session), at);
    }
}

/// The process's PCMs together: the devices of those that run, if any does, and of one of these the rest.
bridge::StreamSettings PcmSessions::settingsOf(Key session) {
    std::set<std::string> devices;
    std::set<std::string> idleDevices;
    const std::pair<const PcmName, OpenPcm>* main = nullptr;
    for (const auto& entry : open_) {
        if (keyOf(entry.second.owner, entry.first.isInput) != session) {
            continue;
        }
        const bool isRunning = entry.second.status.isRunning();
        (isRunning ? devices : idleDevices).insert(entry.second.device);
        if (main == nullptr || (isRunning && !main->second.status.isRunning())) {
            main = &entry;
        }
    }
    Mixer* const mixer = mixerOf(main->first.card);
    return {.isRunning = !devices.empty(),
            .settings = settingsOfPcm(devices.empty() ? idleDevices : devices, main->second.format,
                                      mixer == nullptr ? std::nullopt : mixer->volume(main->first.isInput),
                                      main->first.isInput)};
}

Mixer* PcmSessions::mixerOf(unsigned card) {
    const auto found = cards_.find(card);
    return (found != cards_.end() ? found : cards_.emplace(card, mixers_.open(card)).first)->second.get();
}

void PcmSessions::addDescriptors(std::vector<int>& descriptors) const {
    for (const auto& [card, mixer] : cards_) {
        // One that has changed is read when that has settled.
        if (mixer && mixer->descriptor() >= 0 && !mixersSettle_) {
            descriptors.push_back(mixer->descriptor());
        }
    }
}

void PcmSessions::readMixers() {
    if (!mixersSettle_) {
        mixersSettle_ = clock_.now().steady + kSettling;
    }
}

void PcmSessions::reporterCame() {
    const Moment now = clock_.now();
    std::set<Key> sessions;
    for (const auto& [name, pcm] : open_) {
        sessions.insert(keyOf(pcm.owner, name.isInput));
    }
    for (const Key session : sessions) {
        update(session, now);
    }
}

void PcmSessions::reporterWent() {
    pool_.forget();
}

std::optional<SteadyTime> PcmSessions::due() const {
    std::optional<SteadyTime> due = nextLook_;
    bridge::bringForward(due, mixersSettle_);
    bridge::bringForward(due, pool_.due());
    bridge::bringForward(due, xruns_.due());
    return due;
}

void PcmSessions::run() {
    const Moment now = clock_.now();
    if (mixersSettle_ && *mixersSettle_ <= now.steady) {
        mixersSettle_.reset();
        for (const auto& [card, mixer] : cards_) {
            if (mixer) {
                mixer->read();
            }
        }
        reporterCame();
    }
    if (nextLook_ && *nextLook_ <= now.steady) {
        std::vector<PcmName> names;
        names.reserve(open_.size());
        for (const auto& [name, pcm] : open_) {
            names.push_back(name);
        }
        for (const PcmName& name : names) {
            look(name, false);
        }
        const bool isLively = std::ranges::any_of(open_, [&now](const auto& entry) {
            return entry.second.status.isRunning() || now.steady - entry.second.changedAt.steady < kSomeTime;
        });
        nextLook_ =
            open_.empty() ? std::nullopt : std::optional(now.steady + (isLively ? kInterval : kLongInterval));
    }
    if (const auto time = xruns_.due(); time && *time <= now.steady) {
        xruns_.run();
    }
    pool_.run();
}

void PcmSessions::endAll() {
    pool_.endAll();
    open_.clear();
    cards_.clear();
    nextLook_.reset();
}

} // namespace tamblo::alsa
