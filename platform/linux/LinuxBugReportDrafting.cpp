#include "platform/linux/LinuxBugReportDrafting.h"

namespace tamblo {

void LinuxBugReportDrafting::createDraft(const BugReportDraft&, const std::string&, const std::string&,
                                         Completion) {}

} // namespace tamblo
