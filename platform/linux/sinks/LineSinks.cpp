#include "platform/linux/sinks/LineSinks.h"

#include "base/Base64.h"

namespace tamblo {

void LinuxPowerEventLog::postRegisteredPowerEvent(std::uint32_t subsystem, std::string_view eventName,
                                                  const Dictionary& payload) {
    file_.append([&](TextBuffer& line) {
        SinkLine(line, clock_.now())
            .number("subsystem", subsystem)
            .text("event", eventName)
            .value("payload", payload);
    });
}

void LinuxDiagnosticsMetrics::SubmitMetricRecord(std::uint32_t metric, std::span<const std::uint8_t> record) {
    const std::string text = encodeBase64(record);
    file_.append([&](TextBuffer& line) {
        SinkLine(line, clock_.now()).number("metric", metric).text("record", text);
    });
}

void LinuxBugReportDrafting::createDraft(const BugReportDraft& draft, const std::string& processName,
                                         const std::string& displayReason, Completion completion) {
    file_.append([&](TextBuffer& line) {
        SinkLine(line, clock_.now())
            .text("process", processName)
            .text("reason", displayReason)
            .object("draft", [&draft](JsonObject& fields) {
                fields.text("title", draft.title)
                    .text("problemDescription", draft.problemDescription)
                    .object("component",
                            [&component = draft.component](JsonObject& parts) {
                                parts.text("name", component.name)
                                    .text("version", component.version)
                                    .number("identifier", component.identifier);
                            })
                    .number("reproducibility", draft.reproducibility)
                    .number("classification", draft.classification)
                    .texts("diagnosticExtensions", draft.diagnosticExtensions);
            });
    });
    if (completion) {
        completion(std::nullopt);
    }
}

} // namespace tamblo
