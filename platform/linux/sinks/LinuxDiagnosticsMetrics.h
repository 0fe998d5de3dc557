#pragma once

#include "platform/Clock.h"
#include "platform/DiagnosticsMetricsService.h"
#include "platform/linux/sinks/AppendOnlyFile.h"

#include <string>

namespace tamblo {

/// Metric records as a sink file, `diagnostics-metrics.jsonl`, each in Base64.
class LinuxDiagnosticsMetrics final : public DiagnosticsMetricsService {
public:
    /// Clock and log must outlive it.
    LinuxDiagnosticsMetrics(const std::string& logsDirectory, const Clock& clock, StructuredLog& log,
                            FileOperations& operations = FileOperations::system())
        : clock_(clock), file_(logsDirectory + "/diagnostics-metrics.jsonl", "zrra", log, operations) {}

    void SubmitMetricRecord(std::uint32_t metric, std::span<const std::uint8_t> record) override;
    /// What was recorded goes to the file.
    void flush() { file_.flush(); }

private:
    const Clock& clock_;
    AppendOnlyFile file_;
};

} // namespace tamblo
