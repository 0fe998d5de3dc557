#include "bridge/alsa/report/Xruns.h"

#include "bridge/common/Settings.h"

#include <algorithm>
#include <utility>

namespace tamblo::alsa {

namespace {

constexpr bridge::EventCategory kIO = client::category(bridge::EventKind::io);

/// Whether the position counts from the last start. That of a PCM that was paused goes on.
bool beganAnew(const PcmStatus& before, const PcmStatus& now, std::uint32_t rate) noexcept {
    const double sinceStart =
        std::chrono::duration<double>(now.written - now.trigger).count() * static_cast<double>(rate);
    return now.written >= now.trigger &&
           static_cast<double>(now.position) < sinceStart + static_cast<double>(before.position) / 2;
}

} // namespace

XrunCount xrunsBetween(const PcmStatus& before, const PcmStatus& now, const PcmFormat& format) {
    const bool isOfSameStart = before.trigger == now.trigger;
    if (now.state == PcmState::xrun) {
        return {.xruns = before.state == PcmState::xrun && isOfSameStart ? 0U : 1U};
    }
    if (!before.isRunning() || !now.isRunning()) {
        return {};
    }
    if (!isOfSameStart) {
        return {.restarts = beganAnew(before, now, format.rate) ? 1U : 0U};
    }
    // What drains may run dry.
    const bool ranDry = now.state == PcmState::running && format.bufferFrames != 0 &&
                        now.mostAvailable >= format.bufferFrames;
    return {.xruns = ranDry ? 1U : 0U};
}

void Xruns::count(const PcmName& pcm, const Place& place, const XrunCount& count, double secondsLost,
                  const PcmFormat& format, std::uint64_t position) {
    if (count.xruns + count.restarts == 0) {
        return;
    }
    Tally& tally = tallies_[pcm];
    if (tally.place.session != place.session && tally.hasNews()) {
        report(tally, clock_.now());
    }
    tally.place = place;
    tally.format = format;
    tally.position = position;
    tally.number.xruns += count.xruns;
    tally.number.restarts += count.restarts;
    tally.secondsLost += secondsLost;
    due_ = clock_.now().steady;
}

void Xruns::run() {
    const bridge::Moment now = clock_.now();
    due_.reset();
    for (auto entry = tallies_.begin(); entry != tallies_.end();) {
        Tally& tally = entry->second;
        const bool isEarly = tally.saidAt && now.steady - *tally.saidAt < kInterval;
        if (tally.hasNews() && isEarly) {
            const bridge::SteadyTime next = *tally.saidAt + kInterval;
            due_ = due_ ? std::min(*due_, next) : next;
        } else if (tally.hasNews()) {
            report(tally, now);
        }
        const bool isOver = !tally.hasNews() && (!tally.saidAt || now.steady - *tally.saidAt >= kCalm);
        entry = isOver ? tallies_.erase(entry) : std::next(entry);
    }
}

void Xruns::report(Tally& tally, const bridge::Moment& now) {
    const auto session = sessions_.idOf(tally.place.session);
    const PcmFormat& format = tally.format;
    Dictionary payload{{"node", tally.place.device},
                       {"overload_number", tally.number.xruns + tally.number.restarts},
                       {"xrun_number", tally.number.xruns},
                       {"restart_number", tally.number.restarts},
                       {"io_buffer_size", format.periodFrames},
                       {"smallest_buffer_frame_size", format.periodFrames},
                       {"issue_number", ++issues_}};
    if (format.rate != 0 && format.periodFrames != 0) {
        payload.set("cycle_seconds", bridge::rounded(static_cast<double>(format.periodFrames) / format.rate));
        payload.set("io_cycle", tally.position / format.periodFrames);
    }
    if (!tally.saidAt || now.steady - *tally.saidAt >= kCalm) {
        reporter_.send(session, kIO, bridge::EventType::error, payload, now.wall);
    }
    payload.set("issue_type", "overload");
    payload.set("rtaid_client", tally.place.application);
    payload.set("any_channel_silence_seconds", tally.secondsLost);
    reporter_.send(session, kIO, bridge::EventType::issueDetector, std::move(payload), now.wall);
    tally.number = {};
    tally.secondsLost = 0;
    tally.saidAt = now.steady;
}

} // namespace tamblo::alsa
