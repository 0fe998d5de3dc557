#pragma once

#include "base/Mutex.h"
#include "platform/Clock.h"
#include "platform/DiagnosticCaptureService.h"
#include "platform/WorkQueue.h"
#include "platform/linux/device/ProcessFiles.h"
#include "platform/linux/sinks/AppendOnlyFile.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <vector>

#include <sys/types.h>

namespace tamblo {

/// The diagnostic capture service as a sink file, `stack-captures.jsonl`. Under `stacks` there is one object
/// for each process that is looked at:
///
///     {"process":812,"name":"player","threads":[{"thread":815,"name":"io","samples":[
///         {"count":5,"state":"S (sleeping)","waitChannel":"pipe_read","kernelStack":["pipe_read+0x…",…]}]}]}
///
/// Looked at are the processes that the payload names and those of the clients that are connected when the
/// capture is asked for. All their threads are sampled five times within a tenth of a second, on a queue of
/// the service's own; samples in a row that are equal are one, with their count. A thread that ends keeps the
/// samples that it had, one that begins in that time is not seen.
///
/// One problem may be noticed in many sessions at once: captures that are asked for while another is made
/// share the next sampling, and each has a line with the processes that it is about.
class LinuxDiagnosticCapture final : public DiagnosticCaptureService {
public:
    using ClientProcesses = std::function<std::vector<pid_t>()>;

    /// Samples of each thread: enough to tell one that is stuck, all of whose samples are equal, from one
    /// that happens to wait at that moment; few enough that the capture still shows the moment it was asked
    /// for.
    static constexpr int kSamples = 5;
    /// The pause between two samples: longer than an audio device's usual period of ten or
    /// twenty milliseconds, so that a thread that keeps its deadlines has moved on in between.
    static constexpr std::chrono::milliseconds kSampleInterval{25};
    /// Of all processes of a sampling together: a sample takes some thirty microseconds, so that those of all
    /// threads take less than the interval. Where there are more, each process is cut to a number of threads
    /// that suits all; of more processes than this, those that come last go without.
    static constexpr std::size_t kMaximumThreads = 512;
    /// Captures that wait for the next sampling: a device has some ten sessions that play at a time. Those
    /// beyond, or with payloads of more bytes in memory, are dropped and counted.
    static constexpr std::size_t kMaximumWaiting = 256;
    static constexpr std::size_t kMaximumWaitingBytes = 8U << 20U;

    /// What is referred to must outlive the service, except the queues. The client processes are asked for on
    /// any thread.
    LinuxDiagnosticCapture(SinkFiles& sinks, Clock& clock, WorkQueues& workQueues,
                           ClientProcesses clientProcesses, StructuredLog& log,
                           ProcessFiles files = ProcessFiles());

    void captureStacks(StackCaptureRequest request) override;

private:
    struct Waiting {
        StackCaptureRequest request;
        std::vector<pid_t> clients;
    };

    [[nodiscard]] bool add(Waiting&& waiting) TAMBLO_REQUIRES(mutex_);
    [[nodiscard]] std::vector<Waiting> takeWaiting();
    void captureWaiting();

    Clock& clock_;
    WorkQueues& workQueues_;
    StructuredLog& log_;
    const ClientProcesses clientProcesses_;
    const ProcessFiles files_;
    AppendOnlyFile file_;

    Mutex mutex_;
    std::vector<Waiting> waiting_ TAMBLO_GUARDED_BY(mutex_);
    std::size_t waitingBytes_ TAMBLO_GUARDED_BY(mutex_) = 0; ///< of their payloads
    std::uint64_t dropped_ TAMBLO_GUARDED_BY(mutex_) = 0;    ///< since none waited
    std::unique_ptr<SerialQueue> queue_ TAMBLO_GUARDED_BY(mutex_);
};

} // namespace tamblo
