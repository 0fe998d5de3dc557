#pragma once

#include "platform/BugCaptureService.h"
#include "platform/Clock.h"
#include "platform/WorkQueue.h"
#include "platform/linux/AppendOnlyFile.h"
#include "platform/linux/LinuxStructuredLog.h"

#include <string>

namespace tamblo {

/// The bug-capture service as a sink file, `bug-captures.jsonl`, and a folder for each capture.
class LinuxBugCaptureService final : public BugCaptureService {
public:
    /// What is referred to must outlive the service, except the queues.
    LinuxBugCaptureService(const std::string& logsDirectory, const Clock& clock, WorkQueues& workQueues,
                           LinuxStructuredLog& log, FileOperations& operations = FileOperations::system())
        : clock_(clock),
          workQueues_(workQueues),
          file_(logsDirectory + "/bug-captures.jsonl", "zrrp", log, operations) {}

    [[nodiscard]] std::unique_ptr<GlarnReporter> makeReporter(std::span<const pid_t> processes) override;
    void flush() { file_.flush(); }

private:
    class Reporter;

    const Clock& clock_;
    WorkQueues& workQueues_;
    AppendOnlyFile file_;
};

} // namespace tamblo
