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
    auto samples = std::make_shared<SampleRecording>(processes, platform().clock.now());
    return sampler->add(samples) ? std::make_unique<Recording>(sampler, std::move(samples)) : nullptr;
}

ProcessSampler::ProcessSampler(Shared)
    : queue_(platform().workQueues.makeSerialQueue("com.vandra.tamblo.trace")) {}

ProcessSampler::~ProcessSampler() {
    if (timer_ == nullptr) {
        return;
    }
    // Its end waits for a tick that runs, and a tick reads files: not here, on the session's thread.
    timer_->invalidate();
    queue_->post([timer = std::move(timer_)]() mutable { timer.reset(); }, Pace::mayBlock);
}

bool ProcessSampler::add(std::shared_ptr<SampleRecording> recording) {
    const std::lock_guard lock(mutex_);
    if (recordings_.size() >= kMostRecordings) {
        if (!std::exchange(isFullTold_, true)) {
            log::info(ZRReportingTraceCategory(),
                      "{} sessions are traced already; further ones are not until one of them stops",
                      recordings_.size());
        }
        return false;
    }
    recordings_.push_back(std::move(recording));
    if (timer_ == nullptr) {
        timer_ = platform().workQueues.makeRepeatingTimer(kInterval, [sampler = weak_from_this()] {
            if (const std::shared_ptr<ProcessSampler> alive = sampler.lock()) {
                alive->tick();
            }
        });
        timer_->start();
    }
    return true;
}

void ProcessSampler::forget(const SampleRecording& recording) {
    const std::lock_guard lock(mutex_);
    std::erase_if(recordings_, [&recording](const auto& known) { return known.get() == &recording; });
    isFullTold_ = false;
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
