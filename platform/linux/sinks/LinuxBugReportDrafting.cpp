#include "platform/linux/sinks/LinuxBugReportDrafting.h"

#include "platform/linux/sinks/SinkLine.h"

namespace tamblo {

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
    // A file that cannot be written is told of by itself, once.
    if (completion) {
        completion(std::nullopt);
    }
}

} // namespace tamblo
