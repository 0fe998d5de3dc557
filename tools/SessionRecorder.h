#pragma once

#include "base/Dictionary.h"
#include "tools/SessionFile.h"
#include "tools/records/SinkSnapshot.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace tamblo::tools {

/// Which session of the call-quality file is wanted: the last one that is as asked for.
struct WantedSession {
    std::optional<std::string> name{};
    std::optional<std::int64_t> reporterID{};
    std::optional<std::string> application{};
};

/// A session of the call-quality file.
struct FoundSession {
    std::string name;
    SinkSnapshot::Place place; ///< of its first line
    double start = 0;          ///< in seconds since 1970
    bool hasOpenLine = true;   ///< else its first lines were in files that are gone
    std::int64_t reporterID = 0;
    std::string serviceType = "unknown";
    Dictionary configuration{};
};

/// Reads the whole file once. Nothing when there is no such session; one that is wanted by its name may have
/// lost its beginning.
[[nodiscard]] std::optional<FoundSession> findSession(SinkSnapshot& sink, const WantedSession& wanted);

/// What became of a recording besides what its writer says.
struct RecordingReport {
    bool hasStopped = false;       ///< the session's last line was there
    std::uint64_t unreadable = 0;  ///< lines that name the session and are no JSON that can be played
    std::uint64_t withoutNull = 0; ///< messages with values that have no JSON form, which are missing
    std::uint64_t passedOver = 0;  ///< lines that were torn or too long, of whatever session
};

/// Writes the session's messages from the call-quality file, header first. A message's time is the one at
/// which the service recorded it.
[[nodiscard]] RecordingReport recordSession(SinkSnapshot& sink, const FoundSession& session,
                                            SessionFileWriter& writer);

} // namespace tamblo::tools
