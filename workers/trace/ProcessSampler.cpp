#include "workers/trace/ProcessSampler.h"

#include "platform/Platform.h"
#include "util/Log.h"

#include <algorithm>
#include <optional>
#include <utility>

namespace tamblo {

namespace {

/// What a tick has found out so far.
class Found {
public:
    explicit Found(const ProcessSampling& sampling) : sampling_(sampling) {}

    [[nodiscard]] const std::optional<ProcessSample>& of(pid_t pid) {
        const auto known = std::find_if(processes_.begin(), processes_.end(),
                                        [pid](const auto& process) { return process.first == pid; });
        return known != processes_.end() ? known->second
                                         : processes_.emplace_back(pid, sampling_.sample(pid)).second;
    }

private:
    const ProcessSampling& sampling_;
    std::vector<std::pair<pid_t, std::optional<ProcessSample>>> processes_;
};

} // namespace

std::shared_ptr<ProcessSampler> ProcessSampler::shared() {
    static constinit std::mutex mutex;
    static std::weak_ptr<ProcessSampler> current;
    const std::lock_guard lock(mutex);
    std::shared_ptr<ProcessSampler> sampler = current.lock();
    if (sampler == nullptr) {
        sampler = std::make_shared<ProcessSampler>(Shared());
        current = sampler;
    }
    return sampler;
}

std::unique_ptr<ProcessSampler::Recording> ProcessSampler::record(std::span<const pid_t> processes) {
    const std::shared_ptr<ProcessSampler> sampler = shared();
    std::shared_ptr<SampleRecording> samples = sampler->begin(processes);
    return samples != nullptr ? std::make_unique<Recording>(sampler, std::move(samples)) : nullptr;
}

ProcessSampler::ProcessSampler(Shared)
    : queue_(platform().workQueues.makeSerialQueue("com.vandra.tamblo.trace")) {}

std::shared_ptr<SampleRecording> ProcessSampler::begin(std::span<const pid_t> processes) {
    const std::lock_guard lock(mutex_);
    if (recordings_.size() >= kMostRecordings) {
        if (!std::exchange(isFullTold_, true)) {
            log::info(ZRReportingTraceCategory(),
                      "{} sessions are traced already; further ones are not until one of them stops",
                      recordings_.size());
        }
        return nullptr;
    }
    auto recording = std::make_shared<SampleRecording>(processes, platform().clock.now());
    recordings_.push_back(recording);
    if (timer_ == nullptr) {
        timer_ = platform().workQueues.makeRepeatingTimer(kInterval, [sampler = weak_from_this()] {
            if (const std::shared_ptr<ProcessSampler> alive = sampler.lock()) {
                alive->tick();
            }
        });
        timer_->start();
    }
    return recording;
}

void ProcessSampler::forget(const SampleRecording& recording) {
    std::unique_ptr<RepeatingTimer> ended;
    {
        const std::lock_guard lock(mutex_);
        std::erase_if(recordings_, [&recording](const auto& known) { return known.get() == &recording; });
        isFullTold_ = false;
        if (recordings_.empty()) {
            ended = std::move(timer_);
        }
    }
    if (ended != nullptr) {
        // Its destructor waits for a tick that runs, and a tick reads files: not on the session's thread.
        ended->invalidate();
        queue_->post([timer = std::move(ended)]() mutable { timer.reset(); }, Pace::mayBlock);
    }
}

void ProcessSampler::tick() {
    std::vector<std::shared_ptr<SampleRecording>> recordings;
    {
        const std::lock_guard lock(mutex_);
        recordings = recordings_;
    }
    const Platform& device = platform();
    Found found(device.processSampling);
    for (const std::shared_ptr<SampleRecording>& recording : recordings) {
        for (const pid_t pid : recording->nextTick()) {
            const std::optional<ProcessSample>& figures = found.of(pid);
            recording->add(pid, device.clock.now(), figures);
        }
    }
}

} // namespace tamblo
