#include "platform/Counters.h"

#include <algorithm>
#include <iterator>

namespace tamblo::counters {

namespace {

struct CounterRow {
    Counter counter;
    std::string_view family;
    std::string_view labels;
    std::string_view help; ///< with the first of a family
};

// In the order of the counters.
constexpr CounterRow kRows[] = {
    {Counter::messagesReceived, "messages_received", "",
     "Messages that clients have sent, those refused included."},
    {Counter::messagesRecorded, "messages_recorded", "",
     "Messages that sessions have recorded, once for each session, derived ones included."},
    {Counter::messagesRedundant, "messages_redundant", "",
     "Messages that repeated the last one of their kind, and were not retained."},
    {Counter::messagesRefusedFrame, "messages_refused", R"(stage="decode",reason="wrong_parameters")",
     "Messages that were answered with an error, or would have been."},
    {Counter::messagesRefusedLimit, "messages_refused", R"(stage="decode",reason="limit")", ""},
    {Counter::messagesRefusedDisabled, "messages_refused", R"(stage="queue",reason="reporting_disabled")",
     ""},
    {Counter::messagesLostNoSession, "messages_lost", R"(stage="session",reason="no_session")",
     "Messages, or their records, that were dropped without an error to their sender."},
    {Counter::messagesLostRetained, "messages_lost", R"(stage="retained",reason="limit")", ""},
    {Counter::messagesLostCallQuality, "messages_lost", R"(stage="call_quality",reason="limit")", ""},
    {Counter::messagesLostNoBackEnds, "messages_lost", R"(stage="call_quality",reason="no_back_ends")", ""},
    {Counter::messagesLostSessionGone, "messages_lost", R"(stage="call_quality",reason="session_gone")", ""},
    {Counter::requestsRefusedNotWellFormed, "requests_refused", R"(reason="not_well_formed")",
     "Frames and requests that were refused when they were read."},
    {Counter::requestsRefusedNotARequest, "requests_refused", R"(reason="not_a_request")", ""},
    {Counter::requestsRefusedUnknownMethod, "requests_refused", R"(reason="unknown_method")", ""},
    {Counter::requestsRefusedParameters, "requests_refused", R"(reason="wrong_parameters")", ""},
    {Counter::requestsRefusedLimit, "requests_refused", R"(reason="limit")", ""},
    {Counter::requestsRefusedNotAllowed, "requests_refused", R"(reason="not_allowed")", ""},
    {Counter::requestsLostMemory, "requests_lost", R"(reason="memory")",
     "Requests that have come, and were never carried out."},
    {Counter::requestsLostShutdown, "requests_lost", R"(reason="shutdown")", ""},
    {Counter::requestsLostUnfinished, "requests_lost", R"(reason="unfinished")", ""},
    {Counter::connectionsAccepted, "connections_accepted", "", "Connections of clients that were accepted."},
    {Counter::connectionsTurnedAway, "connections_turned_away", R"(reason="limit")",
     "Connections that were turned away."},
    {Counter::connectionsUnwatched, "connections_turned_away", R"(reason="unwatchable")", ""},
    {Counter::connectionsNoMemory, "connections_turned_away", R"(reason="memory")", ""},
    {Counter::connectionsEndedOrderly, "connections_ended", R"(how="orderly")",
     "Connections that have ended, by the client's end of sending or by a break."},
    {Counter::connectionsEndedInterrupted, "connections_ended", R"(how="interrupted")", ""},
    {Counter::acceptingRests, "accepting_rests", "",
     "Times that accepting rested as the system had no descriptors or memory left."},
    {Counter::sessionsCreated, "sessions_created", "", "Sessions that were made."},
    {Counter::sessionsStarted, "sessions_started", "", "Starts of sessions."},
    {Counter::sessionsStopped, "sessions_stopped", "", "Stops of sessions."},
    {Counter::stopsCut, "stops_cut", "",
     "Stops of sessions whose summaries were cut short, as too much was derived."},
    {Counter::stopsLost, "stops_lost", R"(reason="shutdown")",
     "Sessions that the service ended without, as their stops took too long."},
    {Counter::eventsInUse, "events", R"(in_use="true")",
     "Analytics events that were offered, by whether the device has them in use."},
    {Counter::eventsNotInUse, "events", R"(in_use="false")", ""},
    {Counter::bugCaptures, "captures", R"(kind="bug")", "Captures that were made, by kind."},
    {Counter::stackCaptures, "captures", R"(kind="stack")", ""},
    {Counter::memoryRecords, "captures", R"(kind="memory")", ""},
    {Counter::drafts, "captures", R"(kind="draft")", ""},
    {Counter::bugCapturesRefusedToday, "captures_left_out", R"(kind="bug",reason="daily_limit")",
     "Captures that were asked for and not made."},
    {Counter::bugCapturesInvalid, "captures_left_out", R"(kind="bug",reason="invalid")", ""},
    {Counter::bugCapturesWaiting, "captures_left_out", R"(kind="bug",reason="too_many_wait")", ""},
    {Counter::bugCapturesRate, "captures_left_out", R"(kind="bug",reason="rate")", ""},
    {Counter::bugCapturesCancelled, "captures_left_out", R"(kind="bug",reason="cancelled")", ""},
    {Counter::bugCapturesShutdown, "captures_left_out", R"(kind="bug",reason="shutdown")", ""},
    {Counter::bugCapturesOutage, "captures_left_out", R"(kind="bug",reason="outage")", ""},
    {Counter::stackCapturesWaiting, "captures_left_out", R"(kind="stack",reason="too_many_wait")", ""},
    {Counter::stackCapturesRate, "captures_left_out", R"(kind="stack",reason="rate")", ""},
    {Counter::memoryRecordsWaiting, "captures_left_out", R"(kind="memory",reason="too_many_wait")", ""},
    {Counter::memoryRecordsRate, "captures_left_out", R"(kind="memory",reason="rate")", ""},
    {Counter::draftsBackOff, "captures_left_out", R"(kind="draft",reason="back_off")", ""},
    {Counter::summaryFileMessages, "left_out", R"(what="summary_file_messages")",
     "Things that were left out, mostly as there was too much, by what they are."},
    {Counter::summaryValues, "left_out", R"(what="call_quality_summary_values")", ""},
    {Counter::traceMarks, "left_out", R"(what="performance_file_marks")", ""},
    {Counter::traceSamples, "left_out", R"(what="performance_file_samples")", ""},
    {Counter::tracesOfSessions, "left_out", R"(what="performance_files")", ""},
    {Counter::tracePoints, "left_out", R"(what="trace_points")", ""},
    {Counter::driverFiles, "left_out", R"(what="driver_file_lists")", ""},
    {Counter::driverChannels, "left_out", R"(what="driver_channels")", ""},
    {Counter::driverStreams, "left_out", R"(what="pcm_streams")", ""},
    {Counter::driverDifferences, "left_out", R"(what="driver_differences")", ""},
    {Counter::driverSamples, "left_out", R"(what="driver_samples")", ""},
    {Counter::processes, "left_out", R"(what="processes")", ""},
    {Counter::threads, "left_out", R"(what="threads")", ""},
    {Counter::accessoryLookups, "left_out", R"(what="accessory_lookups")", ""},
    {Counter::accessories, "left_out", R"(what="accessories")", ""},
    {Counter::tapMessages, "left_out", R"(what="tap_messages")", ""},
    {Counter::summaryFilesLost, "report_files_lost", R"(kind="summary")",
     "Files of a session that could not be written, or not whole."},
    {Counter::performanceFilesLost, "report_files_lost", R"(kind="performance")", ""},
    {Counter::reportsRemoved, "files_removed", R"(what="reports")", "Files that were removed to make room."},
    {Counter::captureFoldersRemoved, "files_removed", R"(what="capture_folders")", ""},
    {Counter::sinkFilesRemoved, "files_removed", R"(what="sink_files")", ""},
    {Counter::logLinesRate, "log_lines_left_out", R"(reason="rate")", "Log lines that were not written."},
    {Counter::logLinesUnread, "log_lines_left_out", R"(reason="unread")", ""},
    {Counter::statusReaders, "status_readers", "", "Readers of the status socket that were served."},
    {Counter::statusReadersTurnedAway, "status_readers_let_go", R"(reason="too_many")",
     "Readers of the status socket that were turned away, or let go before they had it all."},
    {Counter::statusReadersOfUser, "status_readers_let_go", R"(reason="too_many_of_user")", ""},
    {Counter::statusReadersSilent, "status_readers_let_go", R"(reason="does_not_read")", ""},
    {Counter::statusReadersUnanswered, "status_readers_let_go", R"(reason="no_answer")", ""},
    {Counter::statusReadersNoMemory, "status_readers_let_go", R"(reason="memory")", ""},
    {Counter::taps, "taps", "", "Taps that were opened."},
    {Counter::tapsTurnedAway, "taps_let_go", R"(reason="too_many")",
     "Taps that were turned away, or ended for another user's."},
    {Counter::tapsOfUser, "taps_let_go", R"(reason="too_many_of_user")", ""},
    {Counter::starts, "starts", "", "Starts of the service since the counters began."},
};
static_assert(std::size(kRows) == static_cast<std::size_t>(Counter::count));

struct SinkRow {
    std::string_view family;
    std::string_view labels; ///< behind the sink's
    std::string_view help;
};
constexpr std::array<SinkRow, kCountsOfSink> kSinkRows{{
    {"sink_lines", "", "Lines that are in a sink's file."},
    {"sink_bytes", "", "Bytes that were written to a sink's file."},
    {"sink_outages", "", "Times that a sink's file could not be written any more."},
    {"sink_lost_lines", R"(,reason="outage")", "Lines that never came into a sink's file."},
    {"sink_lost_lines", R"(,reason="too_long")", ""},
}};

std::array<Slot, kSlots> ownSlots{};

/// The family of the name: the one before, or a new one.
Family& familyNamed(std::vector<Family>& all, std::string_view name, std::string_view help) {
    const auto found = std::ranges::find(all, name, &Family::name);
    if (found != all.end()) {
        return *found;
    }
    all.push_back({.name = name, .help = help, .rows = {}});
    return all.back();
}

std::string label(std::string_view name, std::string_view value) {
    std::string text(name);
    return text.append("=\"").append(value).append("\"");
}

/// A family with a row for each name.
void addNamed(std::vector<Family>& all, std::string_view family, std::string_view help, std::string_view what,
              std::span<const std::string_view> names, std::size_t firstSlot) {
    Family& added = familyNamed(all, family, help);
    for (const std::string_view name : names) {
        added.rows.push_back({label(what, name), firstSlot++});
    }
}

std::uint64_t hashOf(std::uint64_t hash, std::string_view text) noexcept {
    // FNV-1a, and the end of the text.
    for (const char character : text) {
        hash = (hash ^ static_cast<unsigned char>(character)) * 0x100000001B3U;
    }
    return (hash ^ 0xFFU) * 0x100000001B3U;
}

} // namespace

constinit Slot* slots = ownSlots.data();

void keepIn(Slot* place) noexcept {
    for (std::size_t i = 0; i != kSlots; ++i) {
        place[i].fetch_add(slots[i].exchange(0, std::memory_order_relaxed), std::memory_order_relaxed);
    }
    slots = place;
}

void addLimit(std::string_view limit) noexcept {
    const std::string_view name = limit.substr(0, limit.find(':'));
    const auto* const found = std::ranges::find(kLimits, name);
    if (found != kLimits.end()) {
        addTo(kFirstLimit + static_cast<std::size_t>(found - kLimits.begin()), 1);
    }
}

OfSink::OfSink(std::string_view fileName) noexcept {
    const auto* const found = std::ranges::find(kSinks, fileName.substr(0, fileName.rfind('.')));
    if (found != kSinks.end()) {
        first_ = kFirstSink + static_cast<std::size_t>(found - kSinks.begin()) * kCountsOfSink;
    }
}

std::vector<Family> families() {
    std::vector<Family> all;
    for (const CounterRow& row : kRows) {
        familyNamed(all, row.family, row.help).rows.push_back({std::string(row.labels), slotOf(row.counter)});
    }
    for (std::size_t what = 0; what != kCountsOfSink; ++what) {
        const SinkRow& row = kSinkRows[what];
        Family& family = familyNamed(all, row.family, row.help);
        for (std::size_t sink = 0; sink != kSinks.size(); ++sink) {
            family.rows.push_back(
                {label("sink", kSinks[sink]).append(row.labels), kFirstSink + sink * kCountsOfSink + what});
        }
    }
    addNamed(all, "requests", "Requests that were read and are carried out, by method.", "method", kMethods,
             kFirstRequest);
    Family& errors = familyNamed(all, "request_errors", "Requests that were answered with an error.");
    for (std::size_t i = 0; i != kMethods.size() * kRequestErrors.size(); ++i) {
        errors.rows.push_back({label("method", kMethods[i / kRequestErrors.size()])
                                   .append(",")
                                   .append(label("error", kRequestErrors[i % kRequestErrors.size()])),
                               kFirstRequestError + i});
    }
    addNamed(all, "limits_hit", "Times that a client has reached a limit.", "limit", kLimits, kFirstLimit);
    all.push_back({.name = "request_wait_seconds",
                   .help = "How long requests waited from when they were read until they were begun with.",
                   .isHistogram = true,
                   .rows = {{"", kFirstHistogram}}});
    all.push_back({.name = "request_duration_seconds",
                   .help = "How long the server queue took for requests.",
                   .isHistogram = true,
                   .rows = {{"", kFirstHistogram + kSlotsOfHistogram}}});
    return all;
}

std::uint64_t layoutHash() {
    std::uint64_t hash = hashOf(0xCBF29CE484222325U, "tamblo counters");
    for (const Family& family : families()) {
        hash = hashOf(hash, family.name);
        for (const Row& row : family.rows) {
            hash = hashOf(hash, row.labels);
            hash = (hash ^ row.slot) * 0x100000001B3U;
        }
    }
    return hash;
}

} // namespace tamblo::counters
