#pragma once

#include "base/Dictionary.h"
#include "tools/records/SinkFile.h"

#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace tamblo::tools {

/// One summary that the service derived from a session when that stopped.
struct SessionSummary {
    std::string event; ///< its general name, not the one of the session's service type
    Dictionary payload;
};

/// By what a session is told from others that stop at the same time.
struct StoppedSession {
    Value application;
    std::string serviceName;
    std::uint64_t messages = 0; ///< that were sent to it; the service counts its own on top
};

/// The summaries of one session among those of a few that stopped, in the order in which they were written.
/// A stop writes its summaries in one go and in a fixed order, which tells where the next one's begin. The
/// session is recognised by what its own summary says of it; of several alike, and when none is, the last one
/// counts.
[[nodiscard]] std::vector<SessionSummary> summariesOf(const StoppedSession& session,
                                                      std::span<const SessionSummary> written);

/// Tables for people, one for each kind of summary, each behind an empty line.
[[nodiscard]] std::string summaryTables(std::span<const SessionSummary> summaries);

/// Watches the analytics sink while a session stops. Made just before the request to stop, whose reply comes
/// when the sink has the summaries.
class SummaryReader {
public:
    explicit SummaryReader(const std::string& logsDirectory);

    /// The summaries that have come since, or a line that says why there are none.
    [[nodiscard]] std::variant<std::vector<SessionSummary>, std::string> read(const StoppedSession& session);

private:
    const std::string path_;
    SinkFollower sink_;
};

} // namespace tamblo::tools
