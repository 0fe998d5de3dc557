#include "LargeStop.h"

#include <array>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::size_t kPerStretch = 3;
constexpr std::size_t kStretches = 40'000;
/// By the reporter's clock, so that a stretch is longer than the half second below which it is left out.
constexpr double kPerSecond = 2;

/// Output and input run by turns, for three messages each: the first begins the stretch and says all of its
/// settings, the second changes one that the stretch carries and goes on with, the third ends it. The
/// messages are of one kind in a row, so that none of them says what the one of its kind before it said.
Message stretchMessage(std::size_t number) {
    Message message = makeMessage(number, Variety::distinct);
    Dictionary& payload = message.payload;
    const std::size_t stretch = number / kPerStretch;
    const bool isOutput = stretch % 2 == 0;
    const char* const running = isOutput ? "session_output_running" : "session_input_running";
    switch (number % kPerStretch) {
    case 0:
        payload.set(running, true);
        payload.set("active_devices", stretch % 4 < 2 ? "headphones" : "speaker");
        if (isOutput) {
            payload.set("QVSessionVolume", 0.05 * static_cast<double>(1 + stretch % 19));
            payload.set("mFormatID", "aac");
        } else {
            payload.set("vp_config_operation_mode", "default");
        }
        break;
    case 1:
        payload.set(isOutput ? "mFormatID" : "vp_config_operation_mode", isOutput ? "alac" : "telephony");
        break;
    default:
        payload.set(running, false);
        break;
    }
    return message;
}

} // namespace

/// A session of nothing but changes, so that the stop is all deriving.
void stopStretches(Bench& bench) {
    ServiceProcess::Settings settings = bench.place(Placement::oneCore);
    settings.retainedBytes = 1U << 30U;
    const LargeSession session{.messages = kStretches * kPerStretch,
                               .messagesPerSecond = kPerSecond,
                               .make = stretchMessage,
                               .summaries = {"Volume.Summary", "Input.Summary"}};
    std::vector<LargeStop> stops;
    OthersWaits waits;
    for (std::size_t i = 0; i < bench.repetitions(3); ++i) {
        stops.push_back(measureLargeStop(settings, session));
        measureOthersWaits(settings, session, waits);
    }

    const std::vector<std::size_t>& summaries = stops.back().summaries;
    ResultRow row = bench.row("stop_stretches", Placement::oneCore);
    row.set("messages", std::uint64_t{session.messages});
    row.set("volume_summaries", std::uint64_t{summaries[0]});
    row.set("input_summaries", std::uint64_t{summaries[1]});
    setLargeStop(row, stops, waits, 500);
    row.require("40000 summaries", summaries[0] + summaries[1] == kStretches);
    bench.print(row);
}

} // namespace tamblo::bench
