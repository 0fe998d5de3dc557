#pragma once

#include "base/TextBuffer.h"
#include "workers/trace/SessionTrace.h"

namespace tamblo {

/// The trace as a JSON object in the Chrome trace-event format ("JSON Object Format" of the document "Trace
/// Event Format"), which Perfetto and Chrome's trace viewer open: metadata (`M`) that names processes and
/// tracks, complete slices (`X`), instants (`i`) and counters (`C`), one event a line. Times are microseconds
/// since 1970, so that files of several sessions can be laid over each other.
///
/// Rates are of the interval between two samples; a counter that runs backwards has not grown.
[[nodiscard]] TextBuffer chromeTraceText(const SessionTrace& trace);

} // namespace tamblo
