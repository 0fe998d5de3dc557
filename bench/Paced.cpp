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
    const ServiceProcess service(bench.place(placement));
    FrameChannel channel(service.socketPath());
    channel.createSession(kReporterID);
    channel.startSession(kReporterID);
    channel.finish();
    std::vector<wire::Request> requests;
    for (const Message& message : makeMessages(512, Variety::distinct)) {
        requests.push_back(sendRequest(message, kReporterID));
    }

    constexpr std::size_t kMessages = 1000;
    sendPaced(channel, requests, 200);
    std::vector<double> cpu, switches, rate;
    for (std::size_t repetition = 0; repetition < bench.repetitions(5); ++repetition) {
        const std::uint64_t switchesBefore = voluntarySwitchesOf(service.pid());
        const Meter meter(service.pid());
        sendPaced(channel, requests, kMessages);
        cpu.push_back(microseconds(meter.service()) / kMessages);
        rate.push_back(kMessages / secondsOf(meter.wall()));
        switches.push_back(static_cast<double>(voluntarySwitchesOf(service.pid()) - switchesBefore) /
                           kMessages);
    }

    ResultRow row("paced");
    row.set("messages_per_s", median(rate));
    row.set("service_cpu_us_per_message", median(cpu));
    row.set("wake_ups_per_message", median(switches));
    row.set("placement", describe(placement));
    row.atMost("service_cpu_us_per_message", 15);
    bench.print(row);
}

} // namespace

void paced(Bench& bench) {
    measure(bench, Placement::twoCores);
    measure(bench, Placement::oneCore);
}

} // namespace tamblo::bench
