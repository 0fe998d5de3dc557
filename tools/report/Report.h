#pragma once

#include "tools/report/SessionFilter.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace tamblo::report {

/// What to make a report of.
struct ReportPlan {
    std::string directory; ///< the sinks' files
    std::string page;      ///< the path to write to
    SessionFilter wanted;
    std::string selection;         ///< what is wanted, in words for the page; empty: all
    double now = 0;                ///< seconds since 1970
    std::size_t mostBytes = kMost; ///< of memory for sessions

    /// Enough for some ten thousand sessions with a hundred changes each. The program takes as much again
    /// at most, for what it reads and writes.
    static constexpr std::size_t kMost = std::size_t{64} << 20U;
};

struct ReportResult {
    std::size_t sessions = 0;
    std::uint64_t lines = 0;
    std::vector<std::string> leftOut; ///< a line for people each
};

/// Reads the sinks and writes one page that needs nothing else, in one step: a page that was there before
/// stands until the new one is whole. Or a line that says why there is none.
[[nodiscard]] std::variant<ReportResult, std::string> makeReport(const ReportPlan& plan);

} // namespace tamblo::report
