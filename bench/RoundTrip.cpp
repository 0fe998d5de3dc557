#include "Bench.h"
#include "FrameChannel.h"
#include "Meter.h"
#include "Payloads.h"

#include <chrono>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::int64_t kReporterID = 7;

std::vector<double> serviceRoundTrips(FrameChannel& channel, std::vector<wire::Request>& requests,
                                      std::size_t count) {
    std::vector<double> times;
    times.reserve(count);
    for (std::size_t i = 0; i < count; ++i) {
        wire::Request& request = requests[i % requests.size()];
        const auto start = std::chrono::steady_clock::now();
        (void)channel.call(request);
        times.push_back(microseconds(std::chrono::steady_clock::now() - start));
    }
    return times;
}

void measure(Bench& bench, Placement placement) {
    const ServiceProcess::Settings settings = bench.place(placement);
    ServiceProcess service(settings);
    Echo echo(clientProcessor(), settings.processor);
    FrameChannel channel(service.socketPath());
    channel.beginSession(kReporterID);
    channel.finish();
    std::vector<wire::Request> requests = sendRequests(512, kReporterID);

    // In turns, so that both meet what else happens on the machine.
    constexpr std::size_t kPerBlock = 2000;
    std::vector<double> p50, p99, floorP50, floorP99;
    (void)serviceRoundTrips(channel, requests, kPerBlock);
    (void)echo.roundTrips(kPerBlock);
    for (std::size_t block = 0; block < bench.repetitions(9); ++block) {
        const auto floor = echo.roundTrips(kPerBlock);
        floorP50.push_back(quantile(floor, 0.50));
        floorP99.push_back(quantile(floor, 0.99));
        const auto times = serviceRoundTrips(channel, requests, kPerBlock);
        p50.push_back(quantile(times, 0.50));
        p99.push_back(quantile(times, 0.99));
        channel.stopSession(kReporterID);
        channel.startSession(kReporterID);
        channel.finish();
    }

    ResultRow row = bench.row("round_trip", placement);
    row.set("p50_us", median(p50));
    row.set("p99_us", median(p99));
    row.set("floor_p50_us", median(floorP50));
    row.set("floor_p99_us", median(floorP99));
    row.holdAgainst("p50_us", "floor_p50_us", "p50_over_floor");
    row.holdAgainst("p99_us", "floor_p99_us", "p99_over_floor");
    row.atMost("p50_over_floor", placement == Placement::oneCore ? 1.5 : 1.6);
    row.atMost("p99_over_floor", 2.0);
    bench.print(row);
}

} // namespace

void roundTrip(Bench& bench) {
    measure(bench, Placement::twoCores);
    measure(bench, Placement::oneCore);
}

} // namespace tamblo::bench
