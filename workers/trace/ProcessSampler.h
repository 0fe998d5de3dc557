#pragma once

#include "util/Context.h"
#include "workers/trace/SampleRecording.h"

#include <chrono>
#include <cstddef>
#include <memory>
#include <mutex>
#include <span>
#include <vector>

#include <sys/types.h>

namespace tamblo {

/// Samples the processes of all traced sessions, ten times a second, on one thread of its own, each process
/// once in a tick however many sessions it has.
///
/// There is one while a session is traced, and none otherwise: a service that traces nothing makes no
/// wake-up for it. The recordings own it together, and it goes with the last of them.
class ProcessSampler : public std::enable_shared_from_this<ProcessSampler> {
public:
    static constexpr std::chrono::milliseconds kInterval{100};
    /// Sessions traced at a time, with those whose samples still wait for a disk to take their file: bounds
    /// the work of a tick, which reads two of the kernel's files for each process and one for each of its
    /// threads, and the memory of the samples, some 20 MiB at the very most.
    static constexpr std::size_t kMostRecordings = 32;

    /// A recording that goes on until this is destroyed. Used by one thread at a time.
    class Recording {
    public:
        Recording(std::shared_ptr<ProcessSampler> sampler, std::shared_ptr<SampleRecording> samples)
            : sampler_(std::move(sampler)), samples_(std::move(samples)) {}
        ~Recording() { sampler_->forget(*samples_); }
        Recording(const Recording&) = delete;
        Recording& operator=(const Recording&) = delete;

        /// What there is so far; nothing comes after it. It counts as recorded for as long as it is held.
        [[nodiscard]] RecordedSamples take(WallTime now) { return samples_->take(now); }
        /// Does work that may wait for a disk, one piece after the other with that of other recordings.
        void runLater(Work work) { sampler_->queue_->post(std::move(work), Pace::mayBlock); }

    private:
        const std::shared_ptr<ProcessSampler> sampler_;
        const std::shared_ptr<SampleRecording> samples_;
    };

    /// Begins to record these processes; null when as many sessions as may be are recorded already. Any
    /// thread, without waiting.
    [[nodiscard]] static std::unique_ptr<Recording> record(Context& context,
                                                           std::span<const pid_t> processes);

    ProcessSampler(const ProcessSampler&) = delete;
    ProcessSampler& operator=(const ProcessSampler&) = delete;

private:
    /// What the samplers, of which there is one at a time, have in common.
    struct Shared;

    ProcessSampler(Context& context, Shared& shared);
    [[nodiscard]] std::shared_ptr<SampleRecording> begin(std::span<const pid_t> processes);
    void forget(const SampleRecording& recording);
    void tick();

    const Platform& platform_;
    Shared& shared_;
    const std::unique_ptr<SerialQueue> queue_;
    std::mutex mutex_; ///< guards what follows
    std::unique_ptr<RepeatingTimer> timer_;
    std::vector<std::shared_ptr<SampleRecording>> recordings_;
};

} // namespace tamblo
