#include "Bench.h"
#include "FrameChannel.h"
#include "Meter.h"
#include "Payloads.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::int64_t kReporterID = 7;
constexpr std::size_t kFew = 10'000;
constexpr std::size_t kMany = 100'000;
/// The messages of a second by the reporter's clock, in which a segment of each kind ends.
constexpr std::size_t kPerSegment = 100;
constexpr std::array<std::string_view, 3> kSummaries{"Volume.Summary", "Input.Summary", "Kaleen.Summary"};

/// The summaries are written under both of their names, the messages that they are derived from are not.
std::string summaryEvents() {
    std::string names;
    for (const std::string_view summary : kSummaries) {
        for (const std::string_view owner : {"tamblo", "nonlongformaudio"}) {
            names += names.empty() ? "[" : ", ";
            names += "\"com.vandra." + std::string(owner) + "." + std::string(summary) + "\"";
        }
    }
    return names + "]";
}

/// Output plays for ten seconds at a time, in a group session, and its volume and format change every second;
/// input runs for two seconds at a time, and its device changes after one. What follows one another at once
/// are segments of their own.
Message segmentedMessage(std::size_t number, double begin) {
    Message message = makeMessage(number, Variety::distinct);
    Dictionary& payload = message.payload;
    payload.set("zrreporting_timestamp", begin + static_cast<double>(number) / kPerSegment);
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

struct Figures {
    double cpuMilliseconds = 0; ///< of the service
    double wallMilliseconds = 0;
    std::array<std::size_t, kSummaries.size()> summaries{};
};

Figures measure(const ServiceProcess::Settings& settings, std::size_t messages) {
    const ServiceProcess service(settings);
    FrameChannel channel(service.socketPath());
    channel.createSession(kReporterID);
    channel.startSession(kReporterID);
    const std::chrono::duration<double> now = std::chrono::system_clock::now().time_since_epoch();
    const double begin = now.count() - static_cast<double>(messages) / kPerSegment;
    for (std::size_t number = 0; number < messages; ++number) {
        wire::Request request = sendRequest(segmentedMessage(number, begin), kReporterID);
        channel.queue(request);
        if (number % kPerSegment == kPerSegment - 1) {
            channel.finish();
        }
    }
    channel.finish();

    const Meter stopping(service.pid());
    channel.stopSession(kReporterID);
    channel.finish();
    Figures figures;
    figures.wallMilliseconds = microseconds(stopping.wall()) / 1000;
    figures.cpuMilliseconds = microseconds(stopping.service()) / 1000;
    std::transform(kSummaries.begin(), kSummaries.end(), figures.summaries.begin(),
                   [&](std::string_view summary) {
                       return service.countEvents("com.vandra.tamblo." + std::string(summary));
                   });
    return figures;
}

} // namespace

/// As large as sessions get: what is derived when it stops must not grow faster than what it holds.
void stop100k(Bench& bench) {
    ServiceProcess::Settings settings = bench.place(Placement::oneCore);
    settings.eventsInUse = summaryEvents();
    std::vector<double> few, cpu, wall;
    Figures many;
    for (std::size_t i = 0; i < bench.repetitions(5); ++i) {
        few.push_back(measure(settings, kFew).cpuMilliseconds);
        many = measure(settings, kMany);
        cpu.push_back(many.cpuMilliseconds);
        wall.push_back(many.wallMilliseconds);
    }

    ResultRow row("stop_100k");
    row.set("messages", std::uint64_t{kMany});
    row.set("volume_summaries", std::uint64_t{many.summaries[0]});
    row.set("input_summaries", std::uint64_t{many.summaries[1]});
    row.set("kaleen_summaries", std::uint64_t{many.summaries[2]});
    row.set("stop_cpu_ms", median(cpu));
    row.set("stop_wall_ms", median(wall));
    row.set("stop_cpu_ms_at_10000", median(few));
    row.set("ratio", median(cpu) / kMany / (median(few) / kFew));
    row.set("placement", describe(Placement::oneCore));
    row.atMost("stop_cpu_ms", 60);
    row.atMost("ratio", 1.3);
    row.require("1000 summaries of each kind",
                std::all_of(many.summaries.begin(), many.summaries.end(),
                            [](std::size_t count) { return count == kMany / kPerSegment; }));
    bench.print(row);
}

} // namespace tamblo::bench
