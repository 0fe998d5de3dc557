#include "platform/linux/sinks/LinuxDiagnosticsMetrics.h"

#include "base/Base64.h"
#include "platform/linux/sinks/SinkLine.h"

namespace tamblo {

void LinuxDiagnosticsMetrics::SubmitMetricRecord(std::uint32_t metric, std::span<const std::uint8_t> record) {
    const std::string text = encodeBase64(record);
    file_.append([&](TextBuffer& line) {
        SinkLine(line, clock_.now()).number("metric", metric).text("record", text);
    });
}

} // namespace tamblo
