#pragma once

#include "platform/Limits.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <bit>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

/// What the service counts for those who run it: a fixed set of slots, one number each, by which a device's
/// maker sees what came in, what was recorded, and what was dropped where and why. The numbers only grow.
///
/// There is one set for the process. It stands in memory of the program's own until `keepIn` gives it a place
/// that outlives the program. Counting is an addition without a lock, from any thread; who reads sees each
/// number as it was a moment ago, and not all of them at the same moment.
namespace tamblo::counters {

/// Those that stand for themselves. What each means is in the table of `Counters.cpp`, which has a row for
/// each in this order.
enum class Counter : std::uint16_t {
    messagesReceived,
    messagesRecorded,
    messagesRedundant,
    messagesRefusedFrame,
    messagesRefusedLimit,
    messagesRefusedDisabled,
    messagesLostNoSession,
    messagesLostRetained,
    messagesLostCallQuality,
    messagesLostNoBackEnds,
    messagesLostSessionGone,
    requestsRefusedNotWellFormed,
    requestsRefusedNotARequest,
    requestsRefusedUnknownMethod,
    requestsRefusedParameters,
    requestsRefusedLimit,
    requestsRefusedNotAllowed,
    requestsLostMemory,
    requestsLostShutdown,
    requestsLostUnfinished,
    connectionsAccepted,
    connectionsTurnedAway,
    connectionsUnwatched,
    connectionsNoMemory,
    connectionsEndedOrderly,
    connectionsEndedInterrupted,
    acceptingRests,
    sessionsCreated,
    sessionsStarted,
    sessionsStopped,
    stopsCut,
    stopsLost,
    eventsInUse,
    eventsNotInUse,
    bugCaptures,
    stackCaptures,
    memoryRecords,
    drafts,
    bugCapturesRefusedToday,
    bugCapturesInvalid,
    bugCapturesWaiting,
    bugCapturesRate,
    bugCapturesCancelled,
    bugCapturesShutdown,
    bugCapturesOutage,
    stackCapturesWaiting,
    stackCapturesRate,
    memoryRecordsWaiting,
    memoryRecordsRate,
    draftsBackOff,
    summaryFileMessages,
    summaryValues,
    traceMarks,
    traceSamples,
    tracesOfSessions,
    tracePoints,
    driverFiles,
    driverChannels,
    driverStreams,
    driverDifferences,
    driverSamples,
    processes,
    threads,
    accessoryLookups,
    accessories,
    tapMessages,
    summaryFilesLost,
    performanceFilesLost,
    reportsRemoved,
    captureFoldersRemoved,
    sinkFilesRemoved,
    logLinesRate,
    logLinesUnread,
    statusReaders,
    statusReadersTurnedAway,
    statusReadersOfUser,
    statusReadersSilent,
    statusReadersUnanswered,
    statusReadersNoMemory,
    taps,
    tapsTurnedAway,
    tapsOfUser,
    starts,
    count,
};

/// What is counted of each sink.
enum class SinkCount : std::uint8_t { lines, bytes, outages, lostOutage, lostTooLong, count };
/// The sinks, by the names of their files without the ending.
inline constexpr std::array<std::string_view, 8> kSinks{
    "analytics-events", "power-events", "diagnostics-metrics", "call-quality",
    "memory-log",       "bug-captures", "stack-captures",      "bug-report-drafts",
};
/// Requests by their methods, in the order of the protocol's.
inline constexpr std::array<std::string_view, 11> kMethods{
    "createReportingSession",
    "setServiceType",
    "getServiceNameForReporterID",
    "setConfiguration",
    "startReportingSessionForID",
    "sendMessage",
    "stopReportingSessionForID",
    "destroyReportingSession",
    "reporterID",
    "getAllReporters",
    "killService",
};
/// Errors of the requests that have a method.
inline constexpr std::array<std::string_view, 4> kRequestErrors{"wrong_parameters", "limit", "not_allowed",
                                                                "reporting_disabled"};
enum class RequestError : std::uint8_t { wrongParameters, limit, notAllowed, reportingDisabled };
/// Limits that clients reach, by the names that they are told.
inline constexpr auto kLimits = [] {
    std::array<std::string_view, kLimitRows.size() + 2> names{};
    auto* const further = std::ranges::transform(kLimitRows, names.begin(), &LimitRow::name).out;
    further[0] = "descriptors";
    further[1] = "memory";
    return names;
}();
/// How long requests waited until they were begun with, and took.
enum class Histogram : std::uint8_t { waited, took, count };
/// The upper bounds of the buckets grow fourfold from a microsecond on; the last bucket has none.
inline constexpr std::size_t kBounds = 13;
[[nodiscard]] constexpr std::chrono::nanoseconds boundOf(std::size_t bucket) noexcept {
    return std::chrono::microseconds(std::int64_t{1} << (2 * bucket));
}

// Where each group stands among the slots.
inline constexpr std::size_t kFirstSink = static_cast<std::size_t>(Counter::count);
inline constexpr std::size_t kCountsOfSink = static_cast<std::size_t>(SinkCount::count);
inline constexpr std::size_t kFirstRequest = kFirstSink + kSinks.size() * kCountsOfSink;
inline constexpr std::size_t kFirstRequestError = kFirstRequest + kMethods.size();
inline constexpr std::size_t kFirstLimit = kFirstRequestError + kMethods.size() * kRequestErrors.size();
inline constexpr std::size_t kFirstHistogram = kFirstLimit + kLimits.size();
/// The buckets, one without a bound, and the sum of all in nanoseconds.
inline constexpr std::size_t kSlotsOfHistogram = kBounds + 2;
inline constexpr std::size_t kSlots =
    kFirstHistogram + static_cast<std::size_t>(Histogram::count) * kSlotsOfHistogram;

using Slot = std::atomic<std::uint64_t>;
static_assert(Slot::is_always_lock_free && sizeof(Slot) == sizeof(std::uint64_t));

/// Where the slots are now.
extern constinit Slot* slots;

/// Moves the numbers to `kSlots` slots that last, whose own are added to. Before there are other threads; the
/// place stays for as long as anything may count.
void keepIn(Slot* place) noexcept;

[[nodiscard]] constexpr std::size_t slotOf(Counter counter) noexcept {
    return static_cast<std::size_t>(counter);
}
inline void addTo(std::size_t slot, std::uint64_t number) noexcept {
    slots[slot].fetch_add(number, std::memory_order_relaxed);
}
/// For a slot that is counted by one thread at a time, each of which sees what the one before has done:
/// spares the bus lock.
inline void addAloneTo(std::size_t slot, std::uint64_t number) noexcept {
    Slot& place = slots[slot];
    place.store(place.load(std::memory_order_relaxed) + number, std::memory_order_relaxed);
}
inline void add(Counter counter, std::uint64_t number = 1) noexcept {
    addTo(slotOf(counter), number);
}
inline void addAlone(Counter counter, std::uint64_t number = 1) noexcept {
    addAloneTo(slotOf(counter), number);
}
[[nodiscard]] inline std::uint64_t valueOf(std::size_t slot) noexcept {
    return slots[slot].load(std::memory_order_relaxed);
}

/// A request was answered with an error.
inline void addRequestError(std::size_t method, RequestError error) noexcept {
    addTo(kFirstRequestError + method * kRequestErrors.size() + static_cast<std::size_t>(error), 1);
}
/// A limit was reached, by the name that it is told with, or by a text that begins with the name and a colon.
void addLimit(std::string_view limit) noexcept;

/// What a sink counts; under the sink's lock. A file that is no sink of the service's counts nothing.
class OfSink {
public:
    explicit OfSink(std::string_view fileName) noexcept;
    void add(SinkCount what, std::uint64_t number) const noexcept {
        if (first_ != 0) {
            addAloneTo(first_ + static_cast<std::size_t>(what), number);
        }
    }

private:
    std::size_t first_ = 0;
};

/// Notes a time, one at a time.
inline void noteAlone(Histogram histogram, std::chrono::nanoseconds time) noexcept {
    const std::uint64_t nanoseconds = time.count() > 0 ? static_cast<std::uint64_t>(time.count()) : 0;
    // The bound of bucket n is 4^n microseconds, and belongs to it.
    const std::uint64_t below = nanoseconds == 0 ? 0 : (nanoseconds - 1) / 1000;
    const std::size_t bucket = std::min((static_cast<std::size_t>(std::bit_width(below)) + 1) / 2, kBounds);
    const std::size_t first = kFirstHistogram + static_cast<std::size_t>(histogram) * kSlotsOfHistogram;
    addAloneTo(first + bucket, 1);
    addAloneTo(first + kBounds + 1, nanoseconds);
}

/// One number of a family.
struct Row {
    std::string labels; ///< `stage="queue",reason="memory"`, or nothing
    std::size_t slot = 0;
};
/// What belongs together under one name. A histogram has one row, whose slot is its first.
struct Family {
    std::string_view name; ///< without "tamblo_" and "_total"
    std::string_view help;
    bool isHistogram = false;
    std::vector<Row> rows;
};
/// All of them, put together anew.
[[nodiscard]] std::vector<Family> families();
/// Tells one set of slots from another: of names, labels and order.
[[nodiscard]] std::uint64_t layoutHash();

} // namespace tamblo::counters
