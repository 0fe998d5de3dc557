#pragma once

#include "platform/BugReportDraftingService.h"
#include "platform/Clock.h"
#include "platform/linux/sinks/AppendOnlyFile.h"

#include <string>

namespace tamblo {

/// The bug-report drafting service as a sink file, `bug-report-drafts.jsonl`: each draft is a line, for the
/// program that shows drafts to the user. The request is done once its line is appended; what becomes of the
/// file is told by the file itself.
class LinuxBugReportDrafting final : public BugReportDraftingService {
public:
    /// Clock and log must outlive it.
    LinuxBugReportDrafting(const std::string& logsDirectory, const Clock& clock, StructuredLog& log,
                           FileOperations& operations = FileOperations::system())
        : clock_(clock), file_(logsDirectory + "/bug-report-drafts.jsonl", "zrrp", log, operations) {}

    void createDraft(const BugReportDraft& draft, const std::string& processName,
                     const std::string& displayReason, Completion completion) override;
    /// What was recorded goes to the file.
    void flush() { file_.flush(); }

private:
    const Clock& clock_;
    AppendOnlyFile file_;
};

} // namespace tamblo
