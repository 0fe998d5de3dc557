#include "LargeStop.h"
#include "Statistics.h"

#include <algorithm>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::size_t kFew = 10'000;
constexpr std::size_t kMany = 100'000;
/// The messages of a second by the reporter's clock, in which a segment of each kind ends.
constexpr std::size_t kPerSegment = 100;

/// Output plays for ten seconds at a time, in a group session, and its volume and format change every second;
/// input runs for two seconds at a time, and its device changes after one. What follows one another at once
/// are segments of their own.
Message segmentedMessage(std::size_t number) {
    Message message = makeMessage(number, Variety::distinct);
    Dictionary& payload = message.payload;
    const std::size_t segment = number / kPerSegment;
    const bool isOdd = segment % 2 == 1;
    if (number % kPerSegment == 0) {
        payload.set("QVSessionVolume", 0.05 * static_cast<double>(1 + segment % 19));
        payload.set("mFormatID", isOdd ? "aac" : "alac");
        payload.set("kaleen_session", 1);
        if (segment % 10 == 0) {
            payload.set("session_output_running", true);
        }
        if (isOdd) {
            payload.set("active_devices", segment % 4 == 1 ? "headphones" : "speaker");
        } else {
            payload.set("session_input_running", true);
        }
    } else if (number % kPerSegment == kPerSegment - 1) {
        if (segment % 10 == 9) {
            payload.set("session_output_running", false);
        }
        if (isOdd) {
            payload.set("session_input_running", false);
        }
    }
    return message;
}

LargeSession sessionOf(std::size_t messages) {
    return {.messages = messages,
            .messagesPerSecond = kPerSegment,
            .make = segmentedMessage,
            .summaries = {"Volume.Summary", "Input.Summary", "Kaleen.Summary"}};
}

} // namespace

/// As large as sessions get: what is derived when it stops must not grow faster than what it holds.
void stop100k(Bench& bench) {
    const ServiceProcess::Settings settings = bench.place(Placement::oneCore);
    std::vector<double> few;
    OthersWaits waits;
    std::vector<LargeStop> many;
    for (std::size_t i = 0; i < bench.repetitions(5); ++i) {
        few.push_back(measureLargeStop(settings, sessionOf(kFew)).cpuMilliseconds);
        many.push_back(measureLargeStop(settings, sessionOf(kMany)));
        measureOthersWaits(settings, sessionOf(kMany), waits);
    }

    const std::vector<std::size_t>& summaries = many.back().summaries;
    ResultRow row = bench.row("stop_100k", Placement::oneCore);
    row.set("messages", std::uint64_t{kMany});
    row.set("volume_summaries", std::uint64_t{summaries[0]});
    row.set("input_summaries", std::uint64_t{summaries[1]});
    row.set("kaleen_summaries", std::uint64_t{summaries[2]});
    setLargeStop(row, many, waits, 40);
    row.set("stop_cpu_ms_at_10000", median(few));
    row.set("ratio", *row.figure("stop_cpu_ms") / kMany / (median(few) / kFew));
    row.atMost("ratio", 1.3);
    row.require("1000 summaries of each kind",
                std::all_of(summaries.begin(), summaries.end(),
                            [](std::size_t count) { return count == kMany / kPerSegment; }));
    bench.print(row);
}

} // namespace tamblo::bench
