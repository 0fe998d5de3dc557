#pragma once

#include "platform/Clock.h"
#include "platform/MemoryLog.h"
#include "platform/WorkQueue.h"
#include "platform/linux/device/ProcessFiles.h"
#include "platform/linux/loop/LimitedQueue.h"
#include "platform/linux/sinks/AppendOnlyFile.h"

#include <cstddef>
#include <string>

namespace tamblo {

/// The memory log as a sink file, `memory-log.jsonl`:
///
///     {"time":…,"reporter":7,"processes":[{"process":812,"name":"player","resident":…,…}],"kernel":{…}}
///
/// The figures, in bytes, are read from `/proc` on a queue of the log's own, as each process takes some ten
/// microseconds. A process that is gone by then is left out; `kernel` is empty where it cannot be read.
class LinuxMemoryLog final : public MemoryLog {
public:
    /// Each session asks once a second at most; so many wait only when the device is far behind, or somebody
    /// has thousands of sessions.
    static constexpr std::size_t kMaximumWaiting = 256;
    static constexpr std::size_t kMaximumWaitingOfUser = kMaximumWaiting / 4;

    /// What is referred to must outlive the log, except the queues.
    LinuxMemoryLog(SinkFiles& sinks, const Clock& clock, WorkQueues& workQueues, StructuredLog& log,
                   ProcessFiles files = ProcessFiles());

    void logMemory(std::int64_t reporterID, std::vector<pid_t> processes) override;

private:
    void record(std::int64_t reporterID, const std::vector<pid_t>& processes);

    const Clock& clock_;
    const ProcessFiles files_;
    AppendOnlyFile file_;
    LimitedQueue queue_;
};

} // namespace tamblo
