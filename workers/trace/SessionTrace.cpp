#include "workers/trace/SessionTrace.h"

#include "platform/Counters.h"
#include "util/MessageKeys.h"
#include "workers/producers/PayloadFields.h"

#include <chrono>

namespace tamblo {

namespace {

enum class Field { timestamp, output, input, duration, issueType, count };
using Fields = PayloadFields<Field>;

constexpr Fields::Keys kKeys{ZRReportingInternalEventEpochTime, kOutputRunningKey, kInputRunningKey,
                             ZRReportingMessageKeySessionDuration, kIssueTypeKey};

} // namespace

/// One walk over a session's messages.
class MarkSearch::Walk {
public:
    explicit Walk(SessionTrace& trace) : trace_(trace) {}

    void take(const ZRReportingSessionMessage& message) {
        const Fields fields(message.payload(), places_);
        const WallTime time = timeOf(fields[Field::timestamp]);
        output_.take(*this, fields, time);
        input_.take(*this, fields, time);
        const bool isIssue =
            message.type() == AudioEventTypeIssueDetector || message.type() == AudioEventTypeError;
        if (isIssue && hasRoom()) {
            const Value* issueType = fields[Field::issueType];
            trace_.issues.push_back({time, message.category(), message.type(),
                                     issueType != nullptr ? std::optional(*issueType) : std::nullopt});
        }
    }
    void finish() {
        output_.end(*this, trace_.recorded.end);
        input_.end(*this, trace_.recorded.end);
    }

private:
    /// Whether one of output and input runs, and since when.
    struct Running {
        void take(Walk& walk, const Fields& message, WallTime time) {
            const bool runs = message.holds(field) ? message.isTrue(field)
                                                   : since.has_value() && !message.holds(Field::duration);
            if (!runs) {
                end(walk, time);
            } else if (!since) {
                since = time;
            }
        }
        void end(Walk& walk, WallTime time) {
            if (since && *since < time && walk.hasRoom()) {
                stretches.push_back({*since, time});
            }
            since.reset();
        }

        const Field field;
        std::vector<SessionTrace::Stretch>& stretches;
        std::optional<WallTime> since = std::nullopt;
    };

    [[nodiscard]] WallTime timeOf(const Value* timestamp) const noexcept {
        const RecordedSamples& recorded = trace_.recorded;
        const double seconds = timestamp != nullptr ? timestamp->doubleValue() : 0.0;
        // Compared before it becomes an integer, which not every number can.
        if (!(seconds > secondsSince1970(recorded.begin))) {
            return recorded.begin;
        }
        if (seconds >= secondsSince1970(recorded.end)) {
            return recorded.end;
        }
        return WallTime(std::chrono::round<WallTime::duration>(std::chrono::duration<double>(seconds)));
    }

    [[nodiscard]] bool hasRoom() noexcept {
        const std::size_t marks = trace_.output.size() + trace_.input.size() + trace_.issues.size();
        if (marks < SessionTrace::kMostMarks) {
            return true;
        }
        ++trace_.droppedMarks;
        counters::add(counters::Counter::traceMarks);
        return false;
    }

    SessionTrace& trace_;
    KeyPlaces places_{kKeys};
    Running output_{Field::output, trace_.output};
    Running input_{Field::input, trace_.input};
};

MarkSearch::MarkSearch(SessionTrace& trace) : walk_(std::make_unique<Walk>(trace)) {}

MarkSearch::~MarkSearch() = default;

void MarkSearch::take(const ZRReportingSessionMessage& message) {
    walk_->take(message);
}

void MarkSearch::finish() {
    walk_->finish();
}

} // namespace tamblo
