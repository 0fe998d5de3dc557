#pragma once

#include <cstdint>
#include <span>

namespace tamblo {

/// The diagnostics-metrics service: collects metric records, which are Protocol Buffers messages. Any thread;
/// does not block, and what cannot be recorded is the service's own to report.
class DiagnosticsMetricsService {
public:
    virtual ~DiagnosticsMetricsService() = default;
    /// Hands over one encoded record of a metric, by the metric's number.
    virtual void SubmitMetricRecord(std::uint32_t metric, std::span<const std::uint8_t> record) = 0;
};

} // namespace tamblo
