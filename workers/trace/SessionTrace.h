#pragma once

#include "base/Value.h"
#include "session/ZRReportingSessionMessage.h"
#include "util/AudioEvents.h"
#include "workers/trace/SampleRecording.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// What one session's performance file is made of: filled on the reporting server queue, then handed to the
/// queue that writes the file.
struct SessionTrace {
    /// Stretches and issues in one file, some megabyte of it: a client may send as many as it likes.
    static constexpr std::size_t kMostMarks = 10'000;

    /// A stretch of time in which output, or input, ran.
    struct Stretch {
        WallTime begin;
        WallTime end;
    };
    /// A message about an error, or of an issue detector.
    struct Issue {
        WallTime time;
        AudioEventCategory category = 0;
        AudioEventType type = 0;
        std::optional<Value> issueType;
    };

    std::int64_t reporterID = 0;
    std::string_view serviceName; ///< of the vocabulary, which stays
    Value applicationName;
    /// The client's process, whose tracks the stretches and issues are among, and then the service's.
    std::vector<std::string> processNames; ///< one each, empty when not known
    RecordedSamples recorded;
    std::vector<Stretch> output;
    std::vector<Stretch> input;
    std::vector<Issue> issues;
    std::uint64_t droppedMarks = 0;
};

/// Finds the stretches and issues of a stopped session in one pass over its messages, which come in the order
/// of their times. Whether output and input run is read as the summaries' workers do: a `session_duration`
/// ends both. Times outside the recording are moved to its begin or end, and stretches without length are
/// left out. The trace must stay where it is.
class MarkSearch {
public:
    explicit MarkSearch(SessionTrace& trace);
    ~MarkSearch();
    MarkSearch(const MarkSearch&) = delete;
    MarkSearch& operator=(const MarkSearch&) = delete;

    void take(const ZRReportingSessionMessage& message);
    /// After the last one.
    void finish();

private:
    class Walk;
    const std::unique_ptr<Walk> walk_;
};

} // namespace tamblo
