#pragma once

#include "base/Mutex.h"
#include "platform/Clock.h"
#include "platform/ProcessSampling.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <vector>

#include <sys/types.h>

namespace tamblo {

/// What a process was at one time.
struct TimedSample {
    WallTime time;
    ProcessSample figures;
};

/// What was recorded of one session's processes, from its start to its stop.
struct RecordedSamples {
    struct Process {
        pid_t pid = 0;
        std::vector<TimedSample> samples; ///< each later than the one before
        bool hasEnded = false;
    };
    WallTime begin;
    WallTime end;
    std::vector<Process> processes;
    std::shared_ptr<const void> hold; ///< goes with these: so many may be held at a time
};

/// The samples of one session's processes while it is traced. The sampler fills it on its queue, tick by
/// tick; whoever traces the session takes what there is at the end. Nothing here waits for anything but the
/// few instructions that the other thread holds the lock for.
///
/// However long the session, the memory is bounded: when a process has as many samples as are kept, every
/// other one of all processes is dropped, and from then on every other tick is left out. The counters in the
/// samples are totals, so that what is derived from two neighbours is still exact.
///
/// Times are the device's, with steps backwards taken out: the clock goes on from where it was.
class SampleRecording {
public:
    /// Samples of one process, some 300 KiB: seven minutes at ten a second before the first are dropped.
    static constexpr std::size_t kMostSamples = 4096;

    SampleRecording(std::span<const pid_t> processes, WallTime begin,
                    std::shared_ptr<const void> hold = nullptr);

    /// Begins a tick: the processes to look at now, none when it is left out.
    [[nodiscard]] std::vector<pid_t> nextTick();
    /// What was found of one of them in that tick. A process that is not there once has ended: another that
    /// is given its number is none of this session's.
    void add(pid_t pid, WallTime now, const std::optional<ProcessSample>& figures);
    /// Ends the recording.
    [[nodiscard]] RecordedSamples take(WallTime now);

private:
    [[nodiscard]] WallTime withoutStepsBack(WallTime now) noexcept TAMBLO_REQUIRES(mutex_);
    void dropEveryOther() TAMBLO_REQUIRES(mutex_);

    Mutex mutex_;
    RecordedSamples recorded_ TAMBLO_GUARDED_BY(mutex_);
    WallTime last_ TAMBLO_GUARDED_BY(mutex_);
    WallTime::duration stepsBack_ TAMBLO_GUARDED_BY(mutex_){0}; ///< of the clock, altogether
    std::uint64_t tick_ TAMBLO_GUARDED_BY(mutex_) = 0;
    std::uint64_t ticksPerSample_ TAMBLO_GUARDED_BY(mutex_) = 1;
};

} // namespace tamblo
