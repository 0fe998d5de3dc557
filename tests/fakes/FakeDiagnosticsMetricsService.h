#pragma once

#include "platform/DiagnosticsMetricsService.h"

#include <utility>
#include <vector>

namespace tamblo {

/// Keeps what is submitted: the metric's number and the bytes of the record.
class FakeDiagnosticsMetricsService final : public DiagnosticsMetricsService {
public:
    void SubmitMetricRecord(std::uint32_t metric, std::span<const std::uint8_t> record) override {
        records.emplace_back(metric, std::vector<std::uint8_t>(record.begin(), record.end()));
    }

    std::vector<std::pair<std::uint32_t, std::vector<std::uint8_t>>> records;
};

} // namespace tamblo
