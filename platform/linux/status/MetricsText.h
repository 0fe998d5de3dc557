#pragma once

#include "base/TextBuffer.h"

#include <cstdint>
#include <span>
#include <string_view>

namespace tamblo {

/// A number that is as it is now, beside the counters.
struct Gauge {
    std::string_view name; ///< without "tamblo_"
    std::string_view help;
    double value = 0;
    std::string_view labels{}; ///< `version="1.0.0"`, or nothing
};

enum class MetricsForm : std::uint8_t {
    openMetrics, ///< OpenMetrics 1.0, which ends with `# EOF`
    plain,       ///< the text format before it, 0.0.4
};

/// Appends the counters, and these gauges, as text for a monitoring system.
void appendMetrics(TextBuffer& out, std::span<const Gauge> gauges, std::uint64_t countersBegan,
                   MetricsForm form);

} // namespace tamblo
