#pragma once

#include "base/Mutex.h"
#include "util/Context.h"
#include "workers/trace/SampleRecording.h"

#include <chrono>
#include <cstddef>
#include <memory>
#include <span>
#include <utility>
#include <vector>

#include <sys/types.h>

namespace tamblo {

/// Samples the processes of all traced sessions, ten times a second, on a queue of its own, each process once
/// in a tick however many sessions it has. One for all sessions; while none is traced it makes no wake-up.
class ProcessSampler : public std::enable_shared_from_this<ProcessSampler> {
public:
    static constexpr std::chrono::milliseconds kInterval{100};
    /// Sessions traced at a time, with those whose samples still wait for a disk to take their file: bounds
    /// the work of a tick, which reads two of the kernel's files for each process and one for each of its
    /// threads, and the memory of the samples, some 20 MiB at the very most.
    static constexpr std::size_t kMostRecordings = 32;

    /// A recording that goes on until this is destroyed, before the sampler is. Used by one thread at a time.
    class Recording {
    public:
        Recording(ProcessSampler& sampler, std::shared_ptr<SampleRecording> samples)
            : sampler_(sampler), samples_(std::move(samples)) {}
        ~Recording() { sampler_.forget(*samples_); }
        Recording(const Recording&) = delete;
        Recording& operator=(const Recording&) = delete;

        /// What there is so far; nothing comes after it. It counts as recorded for as long as it is held.
        [[nodiscard]] RecordedSamples take(WallTime now) { return samples_->take(now); }
        /// Does work that may wait for a disk, one piece after the other with that of other recordings.
        void runLater(Work work) { sampler_.files_->post(std::move(work), Pace::mayBlock); }

    private:
        ProcessSampler& sampler_;
        const std::shared_ptr<SampleRecording> samples_;
    };

    explicit ProcessSampler(const Platform& platform);

    /// Begins to record these processes; null when as many sessions as may be are recorded already. Any
    /// thread, without waiting.
    [[nodiscard]] std::unique_ptr<Recording> record(std::span<const pid_t> processes);

private:
    void forget(const SampleRecording& recording);
    void tick();
    void scheduleTick() TAMBLO_REQUIRES(mutex_);

    const Platform& platform_;
    const std::unique_ptr<SerialQueue> ticks_;
    const std::unique_ptr<SerialQueue> files_; ///< apart: a slow disk holds no tick up

    Mutex mutex_;
    std::vector<std::shared_ptr<SampleRecording>> recordings_ TAMBLO_GUARDED_BY(mutex_);
    std::unique_ptr<DelayedCall> nextTick_ TAMBLO_GUARDED_BY(mutex_);
    std::chrono::duration<double> due_ TAMBLO_GUARDED_BY(mutex_){
        0}; ///< the next tick, by the device's uptime
    std::size_t heldRecordings_ TAMBLO_GUARDED_BY(mutex_) = 0;
    bool isFullTold_ TAMBLO_GUARDED_BY(mutex_) = false;
};

} // namespace tamblo
