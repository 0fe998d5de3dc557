#pragma once

#include "platform/Clock.h"
#include "platform/DiagnosticCaptureService.h"
#include "platform/WorkQueue.h"
#include "platform/linux/device/ProcessFiles.h"
#include "platform/linux/loop/LimitedQueue.h"
#include "platform/linux/sinks/AppendOnlyFile.h"

#include <chrono>
#include <cstddef>
#include <functional>
#include <string>
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
    /// Of all processes together: a sample takes some thirty microseconds, so that those of all threads take
    /// less than the interval. Where there are more, each process is cut to a number of threads that suits
    /// all; of more processes than this, those that come last go without.
    static constexpr std::size_t kMaximumThreads = 512;
    /// Each takes a tenth of a second, by which it can hold up the service's end.
    static constexpr std::size_t kMaximumWaiting = 4;

    /// What is referred to must outlive the service, except the queues. The client processes are asked for on
    /// any thread.
    LinuxDiagnosticCapture(SinkFiles& sinks, Clock& clock, WorkQueues& workQueues,
                           ClientProcesses clientProcesses, StructuredLog& log,
                           ProcessFiles files = ProcessFiles());

    void captureStacks(StackCaptureRequest request) override;

private:
    void capture(const StackCaptureRequest& request, const std::vector<pid_t>& clients);

    Clock& clock_;
    const ClientProcesses clientProcesses_;
    const ProcessFiles files_;
    AppendOnlyFile file_;
    LimitedQueue queue_;
};

} // namespace tamblo
