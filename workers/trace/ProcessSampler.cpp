#include "workers/trace/ProcessSampler.h"

#include "util/Log.h"

#include <algorithm>
#include <atomic>
#include <optional>
#include <utility>

namespace tamblo {

namespace {

/// The places for samples in memory.
struct Places {
    std::atomic<std::size_t> taken{0};
    std::atomic<bool> isFullTold{false};
};

/// One of them.
class Place {
public:
    explicit Place(Places& places) noexcept : places_(places) { ++places_.taken; }
    ~Place() {
        --places_.taken;
        places_.isFullTold = false;
    }
    Place(const Place&) = delete;
    Place& operator=(const Place&) = delete;

private:
    Places& places_;
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

struct ProcessSampler::Shared {
    [[nodiscard]] std::shared_ptr<ProcessSampler> sampler(Context& context) {
        const MutexLock lock(mutex);
        std::shared_ptr<ProcessSampler> sampler = current.lock();
        if (sampler == nullptr) {
            sampler.reset(new ProcessSampler(context, *this));
            current = sampler;
        }
        return sampler;
    }

    Places places;
    Mutex mutex;
    std::weak_ptr<ProcessSampler> current TAMBLO_GUARDED_BY(mutex);
};

std::unique_ptr<ProcessSampler::Recording> ProcessSampler::record(Context& context,
                                                                  std::span<const pid_t> processes) {
    const std::shared_ptr<ProcessSampler> sampler = context.shared<Shared>().sampler(context);
    std::shared_ptr<SampleRecording> samples = sampler->begin(processes);
    return samples != nullptr ? std::make_unique<Recording>(sampler, std::move(samples)) : nullptr;
}

ProcessSampler::ProcessSampler(Context& context, Shared& shared)
    : platform_(context.platform()),
      shared_(shared),
      queue_(platform_.workQueues->makeSerialQueue("com.vandra.tamblo.trace")) {}

std::shared_ptr<SampleRecording> ProcessSampler::begin(std::span<const pid_t> processes) {
    const std::lock_guard lock(mutex_);
    if (shared_.places.taken >= kMostRecordings) {
        if (!shared_.places.isFullTold.exchange(true)) {
            log::info(ZRReportingTraceCategory(),
                      "{} sessions are traced already; further ones are not until one of their files is done",
                      kMostRecordings);
        }
        return nullptr;
    }
    auto recording = std::make_shared<SampleRecording>(processes, platform_.clock->now(),
                                                       std::make_shared<const Place>(shared_.places));
    recordings_.push_back(recording);
    if (timer_ == nullptr) {
        timer_ = platform_.workQueues->makeRepeatingTimer(kInterval, [sampler = weak_from_this()] {
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
    Found found(*platform_.processSampling);
    for (const std::shared_ptr<SampleRecording>& recording : recordings) {
        for (const pid_t pid : recording->nextTick()) {
            const std::optional<ProcessSample>& figures = found.of(pid);
            recording->add(pid, platform_.clock->now(), figures);
        }
    }
}

} // namespace tamblo
