#include "Bench.h"
#include "FrameChannel.h"
#include "Meter.h"
#include "Payloads.h"

#include <chrono>
#include <thread>

namespace tamblo::bench {

namespace {

constexpr std::int64_t kReporterID = 7;
constexpr std::chrono::milliseconds kInterval{1};

/// One message for each interval; its reply is waited for, as a client that listens does.
void sendPaced(FrameChannel& channel, std::vector<wire::Request>& requests, std::size_t count) {
    auto next = std::chrono::steady_clock::now();
    for (std::size_t i = 0; i < count; ++i) {
        (void)channel.call(requests[i % requests.size()]);
        next += kInterval;
        std::this_thread::sleep_until(next);
    }
}

void measure(Bench& bench, Placement placement) {
    const ServiceProcess::Settings settings = bench.place(placement);
    const ServiceProcess service(settings);
    Echo echo(clientProcessor(), settings.processor);
    FrameChannel channel(service.socketPath());
    channel.beginSession(kReporterID);
    channel.finish();
    std::vector<wire::Request> requests = sendRequests(512, kReporterID);

    // In turns, so that both meet what else happens on the machine.
    constexpr std::size_t kMessages = 500;
    sendPaced(channel, requests, 200);
    std::vector<double> cpu, floor, switches, rate;
    for (std::size_t repetition = 0; repetition < bench.repetitions(7); ++repetition) {
        floor.push_back(echo.pacedCost(kMessages, kInterval));
        const std::uint64_t switchesBefore = voluntarySwitchesOf(service.pid());
        const Meter meter(service.pid());
        sendPaced(channel, requests, kMessages);
        cpu.push_back(microseconds(meter.service()) / kMessages);
        rate.push_back(kMessages / secondsOf(meter.wall()));
        switches.push_back(static_cast<double>(voluntarySwitchesOf(service.pid()) - switchesBefore) /
                           kMessages);
    }

    ResultRow row = bench.row("paced", placement);
    row.set("messages_per_s", median(rate));
    row.set("service_cpu_us_per_message", median(cpu));
    row.set("wake_ups_per_message", median(switches));
    row.set("floor_paced_us", median(floor));
    row.holdAgainst("service_cpu_us_per_message", "floor_paced_us", "over_floor_paced");
    row.atMost("over_floor_paced", placement == Placement::oneCore ? 1.8 : 1.2);
    bench.print(row);
}

} // namespace

void paced(Bench& bench) {
    measure(bench, Placement::twoCores);
    measure(bench, Placement::oneCore);
}

} // namespace tamblo::bench
