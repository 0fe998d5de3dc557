#pragma once

#include "platform/Clock.h"
#include "platform/MemoryLog.h"
#include "platform/WorkQueue.h"
#include "platform/linux/AppendOnlyFile.h"

#include <string>

namespace tamblo {

/// The memory log as a sink file, `memory-log.jsonl`.
class LinuxMemoryLog final : public MemoryLog {
public:
    /// What is referred to must outlive the log, except the queues.
    LinuxMemoryLog(const std::string& logsDirectory, const Clock& clock, WorkQueues& workQueues,
                   StructuredLog& log, FileOperations& operations = FileOperations::system())
        : clock_(clock),
          workQueues_(workQueues),
          file_(logsDirectory + "/memory-log.jsonl", "zrrs", log, operations) {}

    void logMemory(std::int64_t reporterID, std::vector<pid_t> processes) override;

private:
    const Clock& clock_;
    WorkQueues& workQueues_;
    AppendOnlyFile file_;
};

} // namespace tamblo
