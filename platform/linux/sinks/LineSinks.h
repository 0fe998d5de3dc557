#pragma once

#include "platform/BugReportDraftingService.h"
#include "platform/Clock.h"
#include "platform/DiagnosticsMetricsService.h"
#include "platform/PowerEventLog.h"
#include "platform/linux/sinks/AppendOnlyFile.h"

#include <string>

namespace tamblo {

// The platform's services that are a sink file each and make one line of each call. A call is done once its
// line is appended; what becomes of the file is told by the file itself. The clock must outlive them.

/// `power-events.jsonl`.
class LinuxPowerEventLog final : public PowerEventLog {
public:
    LinuxPowerEventLog(SinkFiles& sinks, const Clock& clock)
        : clock_(clock), file_(sinks, "power-events.jsonl", "zrrp") {}
    void postRegisteredPowerEvent(std::uint32_t subsystem, std::string_view eventName,
                                  const Dictionary& payload) override;

private:
    const Clock& clock_;
    AppendOnlyFile file_;
};

/// `diagnostics-metrics.jsonl`, each record in Base64.
class LinuxDiagnosticsMetrics final : public DiagnosticsMetricsService {
public:
    LinuxDiagnosticsMetrics(SinkFiles& sinks, const Clock& clock)
        : clock_(clock), file_(sinks, "diagnostics-metrics.jsonl", "zrra") {}
    void SubmitMetricRecord(std::uint32_t metric, std::span<const std::uint8_t> record) override;

private:
    const Clock& clock_;
    AppendOnlyFile file_;
};

/// `bug-report-drafts.jsonl`, for the program that shows drafts to the user.
class LinuxBugReportDrafting final : public BugReportDraftingService {
public:
    LinuxBugReportDrafting(SinkFiles& sinks, const Clock& clock)
        : clock_(clock), file_(sinks, "bug-report-drafts.jsonl", "zrrr") {}
    void createDraft(const BugReportDraft& draft, const std::string& processName,
                     const std::string& displayReason, Completion completion) override;

private:
    const Clock& clock_;
    AppendOnlyFile file_;
};

} // namespace tamblo
