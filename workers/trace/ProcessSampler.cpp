#include "workers/trace/ProcessSampler.h"

#include "base/WhileAlive.h"
#include "platform/Counters.h"
#include "util/Log.h"

#include <algorithm>
#include <map>
#include <optional>

namespace tamblo {

ProcessSampler::ProcessSampler(const Platform& platform)
    : platform_(platform),
      ticks_(platform.workQueues->makeSerialQueue("com.vandra.tamblo.trace.samples")),
      files_(platform.workQueues->makeSerialQueue("com.vandra.tamblo.trace")) {}

std::unique_ptr<ProcessSampler::Recording> ProcessSampler::record(std::span<const pid_t> processes) {
    const MutexLock lock(mutex_);
    if (heldRecordings_ >= kMostRecordings) {
        counters::add(counters::Counter::tracesOfSessions);
        if (!std::exchange(isFullTold_, true)) {
            log::info(ZRReportingTraceCategory(),
                      "{} sessions are traced already; further ones are not until one of their files is done",
                      kMostRecordings);
        }
        return nullptr;
    }
    ++heldRecordings_;
    const std::shared_ptr<const void> hold(static_cast<const void*>(this), [this](const void*) {
        const MutexLock releasing(mutex_);
        --heldRecordings_;
        isFullTold_ = false;
    });
    recordings_.push_back(std::make_shared<SampleRecording>(processes, platform_.clock->now(), hold));
    if (recordings_.size() == 1) {
        due_ = platform_.processInformation->systemUptime();
        scheduleTick();
    }
    return std::make_unique<Recording>(*this, recordings_.back());
}

void ProcessSampler::forget(const SampleRecording& recording) {
    const MutexLock lock(mutex_);
    std::erase_if(recordings_, [&recording](const auto& known) { return known.get() == &recording; });
    if (recordings_.empty()) {
        nextTick_.reset();
    }
}

void ProcessSampler::scheduleTick() {
    const auto now = platform_.processInformation->systemUptime();
    // From tick to tick, not from the end of one to the next; ticks that were missed are left out.
    due_ = std::max<std::chrono::duration<double>>(due_ + kInterval, now);
    nextTick_ = platform_.workQueues->callAfter(
        std::chrono::round<std::chrono::milliseconds>(due_ - now),
        whileAlive(weak_from_this(), [](ProcessSampler& sampler) {
            sampler.ticks_->post(
                whileAlive(sampler.weak_from_this(), [](ProcessSampler& held) { held.tick(); }),
                Pace::mayBlock);
        }));
}

void ProcessSampler::tick() {
    std::vector<std::shared_ptr<SampleRecording>> recordings;
    {
        const MutexLock lock(mutex_);
        recordings = recordings_;
    }
    std::map<pid_t, std::optional<ProcessSample>> samples;
    for (const std::shared_ptr<SampleRecording>& recording : recordings) {
        for (const pid_t pid : recording->nextTick()) {
            const auto [sample, isNew] = samples.try_emplace(pid);
            if (isNew) {
                sample->second = platform_.processSampling->sample(pid);
            }
            recording->add(pid, platform_.clock->now(), sample->second);
        }
    }
    const MutexLock lock(mutex_);
    if (!recordings_.empty()) {
        scheduleTick();
    }
}

} // namespace tamblo
