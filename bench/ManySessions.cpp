#include "Bench.h"
#include "FrameChannel.h"
#include "Meter.h"

#include <cstdint>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::int64_t kFew = 1'000;
constexpr std::int64_t kMany = 10'000;

struct Figures {
    double createMicroseconds = 0; ///< of the service's processor time, for each session
    double startMicroseconds = 0;
    double stopMicroseconds = 0;
    double stopSeconds = 0; ///< all of them, wall time
    double bytes = 0;       ///< for each session
    std::size_t threads = 0;
    std::size_t resident = 0;
};

/// All sessions of one client, started, and stopped one after the other with all requests under way.
Figures measure(const ServiceProcess::Settings& settings, std::int64_t sessions) {
    const ServiceProcess service(settings);
    const auto count = static_cast<double>(sessions);
    FrameChannel channel(service.socketPath());
    wire::Request request = reporterRequest(wire::Method::getAllReporters, 0);
    (void)channel.call(request);
    const std::size_t residentBefore = residentBytesOf(service.pid());
    Figures figures;

    const Meter creating(service.pid());
    for (std::int64_t id = 1; id <= sessions; ++id) {
        channel.createSession(id);
        if (id % 100 == 0) {
            channel.finish();
        }
    }
    channel.finish();
    figures.createMicroseconds = microseconds(creating.service()) / count;

    const Meter starting(service.pid());
    for (std::int64_t id = 1; id <= sessions; ++id) {
        channel.startSession(id);
    }
    (void)channel.call(request);
    figures.startMicroseconds = microseconds(starting.service()) / count;
    figures.resident = residentBytesOf(service.pid());
    figures.bytes = static_cast<double>(figures.resident - residentBefore) / count;
    figures.threads = threadCountOf(service.pid());

    const Meter stopping(service.pid());
    for (std::int64_t id = 1; id <= sessions; ++id) {
        channel.stopSession(id);
    }
    channel.finish();
    figures.stopMicroseconds = microseconds(stopping.service()) / count;
    figures.stopSeconds = secondsOf(stopping.wall());
    return figures;
}

} // namespace

void manySessions(Bench& bench) {
    const ServiceProcess::Settings settings = bench.place(Placement::oneCore);
    std::vector<double> createRatio, startRatio, stopRatio, start, stop;
    Figures many;
    for (std::size_t i = 0; i < bench.repetitions(3); ++i) {
        const Figures few = measure(settings, kFew);
        many = measure(settings, kMany);
        createRatio.push_back(many.createMicroseconds / few.createMicroseconds);
        startRatio.push_back(many.startMicroseconds / few.startMicroseconds);
        stopRatio.push_back(many.stopMicroseconds / few.stopMicroseconds);
        start.push_back(many.startMicroseconds);
        stop.push_back(many.stopMicroseconds);
    }

    ResultRow row = bench.row("many_sessions", Placement::oneCore);
    row.set("sessions", static_cast<std::uint64_t>(kMany));
    row.set("threads", std::uint64_t{many.threads});
    row.set("kib_per_session", many.bytes / 1024);
    row.set("rss_mib", mebibytes(many.resident));
    row.set("start_cpu_us_per_session", median(start));
    row.set("stop_cpu_us_per_session", median(stop));
    row.set("stop_of_all_s", many.stopSeconds);
    row.set("create_ratio", median(createRatio));
    row.set("start_ratio", median(startRatio));
    row.set("stop_ratio", median(stopRatio));
    row.set("ratios", "cost of a session among 10000 over that among 1000");
    row.atMost("threads", 19);
    row.atMost("kib_per_session", 16);
    row.atMost("create_ratio", 1.3);
    row.atMost("start_ratio", 1.3);
    row.atMost("stop_ratio", 1.3);
    bench.print(row);
}

} // namespace tamblo::bench
