#include "workers/trace/SampleRecording.h"

#include "platform/Counters.h"

#include <algorithm>
#include <utility>

namespace tamblo {

SampleRecording::SampleRecording(std::span<const pid_t> processes, WallTime begin,
                                 std::shared_ptr<const void> hold)
    : last_(begin) {
    recorded_.begin = begin;
    recorded_.hold = std::move(hold);
    for (const pid_t pid : processes) {
        recorded_.processes.emplace_back().pid = pid;
    }
}

std::vector<pid_t> SampleRecording::nextTick() {
    std::vector<pid_t> wanted;
    const MutexLock lock(mutex_);
    if (std::any_of(recorded_.processes.begin(), recorded_.processes.end(),
                    [](const auto& process) { return process.samples.size() >= kMostSamples; })) {
        dropEveryOther();
    }
    if (tick_++ % ticksPerSample_ != 0) {
        return wanted;
    }
    for (const RecordedSamples::Process& process : recorded_.processes) {
        if (!process.hasEnded) {
            wanted.push_back(process.pid);
        }
    }
    return wanted;
}

void SampleRecording::add(pid_t pid, WallTime now, const std::optional<ProcessSample>& figures) {
    const MutexLock lock(mutex_);
    const auto process = std::find_if(recorded_.processes.begin(), recorded_.processes.end(),
                                      [pid](const auto& known) { return known.pid == pid; });
    if (process == recorded_.processes.end()) {
        return;
    }
    if (!figures) {
        process->hasEnded = true;
        return;
    }
    process->samples.push_back({withoutStepsBack(now), *figures});
}

RecordedSamples SampleRecording::take(WallTime now) {
    const MutexLock lock(mutex_);
    recorded_.end = withoutStepsBack(now);
    RecordedSamples taken;
    std::swap(taken, recorded_);
    return taken;
}

WallTime SampleRecording::withoutStepsBack(WallTime now) noexcept {
    if (now + stepsBack_ < last_) {
        stepsBack_ = last_ - now;
    }
    last_ = now + stepsBack_;
    return last_;
}

void SampleRecording::dropEveryOther() {
    for (RecordedSamples::Process& process : recorded_.processes) {
        std::vector<TimedSample>& samples = process.samples;
        for (std::size_t i = 0; 2 * i < samples.size(); ++i) {
            samples[i] = samples[2 * i];
        }
        counters::add(counters::Counter::traceSamples, samples.size() / 2);
        samples.resize((samples.size() + 1) / 2);
    }
    ticksPerSample_ *= 2;
}

} // namespace tamblo
