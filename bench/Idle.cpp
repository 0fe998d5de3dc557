#include "Bench.h"
#include "FrameChannel.h"
#include "Meter.h"

#include <algorithm>
#include <thread>
#include <vector>

namespace tamblo::bench {

void idle(Bench& bench) {
    const ServiceProcess service(bench.place(Placement::twoCores));
    std::this_thread::sleep_for(std::chrono::milliseconds(500));
    const std::uint64_t before = voluntarySwitchesOf(service.pid());
    const Meter meter(service.pid());
    std::this_thread::sleep_for(std::chrono::seconds(bench.quick() ? 3 : 10));

    ResultRow row = bench.row("idle", Placement::twoCores);
    row.set("wake_ups", voluntarySwitchesOf(service.pid()) - before);
    row.set("service_cpu_us", microseconds(meter.service()));
    row.set("seconds", secondsOf(meter.wall()));
    row.set("rss_mib", mebibytes(residentBytesOf(service.pid())));
    row.set("threads", std::uint64_t{threadCountOf(service.pid())});
    row.atMost("wake_ups", 0);
    row.atMost("rss_mib", 6);
    bench.print(row);
}

void startUp(Bench& bench) {
    std::vector<double> ready, answered;
    for (std::size_t i = 0; i < bench.repetitions(15); ++i) {
        const ServiceProcess service(bench.place(Placement::twoCores));
        FrameChannel channel(service.socketPath());
        wire::Request request = reporterRequest(wire::Method::getAllReporters, 0);
        (void)channel.call(request);
        answered.push_back(microseconds(service.age()) / 1000);
        ready.push_back(microseconds(service.timeUntilReady()) / 1000);
    }

    ResultRow row = bench.row("start_up", Placement::twoCores);
    row.set("ready_ms", median(ready));
    row.set("first_answer_ms", median(answered));
    row.set("first_answer_ms_slowest", *std::max_element(answered.begin(), answered.end()));
    row.set("counted", "from before the fork to the first client's first reply");
    row.atMost("first_answer_ms", 10);
    bench.print(row);
}

} // namespace tamblo::bench
