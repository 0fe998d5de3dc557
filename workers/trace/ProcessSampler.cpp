#include "workers/trace/ProcessSampler.h"

#include "platform/Platform.h"
#include "util/Log.h"

#include <algorithm>
#include <atomic>
#include <optional>
#include <utility>

namespace tamblo {

namespace {

constinit std::atomic<std::size_t> placesTaken{0};
constinit std::atomic<bool> isFullTold{false};

/// One of the places for samples in memory.
struct Place {
    Place() noexcept { ++placesTaken; }
    ~Place() {
        --placesTaken;
        isFullTold = false;
    }
    Place(const Place&) = delete;
    Place& operator=(const Place&) = delete;
};

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
        sampler.reset(new ProcessSampler);
        current = sampler;
    }
    return sampler;
}

std::unique_ptr<ProcessSampler::Recording> ProcessSampler::record(std::span<const pid_t> processes) {
    const std::shared_ptr<ProcessSampler> sampler = shared();
    std::shared_ptr<SampleRecording> samples = sampler->begin(processes);
    return samples != nullptr ? std::make_unique<Recording>(sampler, std::move(samples)) : nullptr;
}

ProcessSampler::ProcessSampler() : queue_(platform().workQueues.makeSerialQueue("com.vandra.tamblo.trace")) {}

std::shared_ptr<SampleRecording> ProcessSampler::begin(std::span<const pid_t> processes) {
    const std::lock_guard lock(mutex_);
    if (placesTaken >= kMostRecordings) {
        if (!isFullTold.exchange(true)) {
            log::info(ZRReportingTraceCategory(),
                      "{} sessions are traced already; further ones are not until one of their files is done",
                      kMostRecordings);
        }
        return nullptr;
    }
    auto recording =
        std::make_shared<SampleRecording>(processes, platform().clock.now(), std::make_shared<const Place>());
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
