#pragma once

#include "platform/Clock.h"
#include "platform/DiagnosticCaptureService.h"
#include "platform/WorkQueue.h"
#include "platform/linux/AppendOnlyFile.h"

#include <functional>
#include <string>
#include <vector>

#include <sys/types.h>

namespace tamblo {

/// The diagnostic capture service as a sink file, `stack-captures.jsonl`.
class LinuxDiagnosticCapture final : public DiagnosticCaptureService {
public:
    using ClientProcesses = std::function<std::vector<pid_t>()>;

    /// What is referred to must outlive the service, except the queues. The client processes are asked for on
    /// any thread.
    LinuxDiagnosticCapture(const std::string& logsDirectory, const Clock& clock, WorkQueues& workQueues,
                           ClientProcesses clientProcesses, StructuredLog& log,
                           FileOperations& operations = FileOperations::system())
        : clock_(clock),
          workQueues_(workQueues),
          clientProcesses_(std::move(clientProcesses)),
          file_(logsDirectory + "/stack-captures.jsonl", "zrrp", log, operations) {}

    void captureStacks(StackCaptureRequest request) override;

private:
    const Clock& clock_;
    WorkQueues& workQueues_;
    const ClientProcesses clientProcesses_;
    AppendOnlyFile file_;
};

} // namespace tamblo
