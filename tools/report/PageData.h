#pragma once

#include "tools/report/PageWriter.h"
#include "tools/report/Session.h"
#include "tools/report/SinkLines.h"

#include <deque>
#include <span>
#include <string>
#include <vector>

namespace tamblo::report {

/// Everything that a page shows.
struct PageData {
    double made = 0;           ///< seconds since 1970
    std::string selection;     ///< in words; empty: everything
    std::string captureFolder; ///< from the page's directory, with a slash behind it
    ReadCounts read;
    std::vector<std::string> leftOut;
    std::vector<const Session*> sessions; ///< by their beginning
    std::deque<DeviceEvent> device;
    std::vector<std::string> keys;
    std::vector<std::string> folders; ///< of captures that there are
};

/// Writes the page's data as JSON, one session at a time. Times are milliseconds from `base`.
void writePageData(PageWriter& out, const PageData& data);

} // namespace tamblo::report
