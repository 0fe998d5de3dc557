#include "LargeStop.h"

#include "FrameChannel.h"
#include "Meter.h"

#include <algorithm>
#include <chrono>
#include <optional>
#include <string>

namespace tamblo::bench {

namespace {

constexpr std::int64_t kReporterID = 7;
constexpr std::int64_t kOther = 8;
constexpr std::size_t kInFlight = 100;
/// Of another client, that a stop may cost it.
constexpr double kLongestWaitMilliseconds = 5;
/// What the service has put off at the stop, it does within that time; as long before, the other client is
/// alone, which tells how much of the waits is the machine's.
constexpr std::chrono::milliseconds kAfterwards{300};

void sendAll(const ServiceProcess& service, FrameChannel& channel, const LargeSession& session) {
    channel.beginSession(kReporterID);
    const std::chrono::duration<double> now = std::chrono::system_clock::now().time_since_epoch();
    const double begin = now.count() - static_cast<double>(session.messages) / session.messagesPerSecond;
    for (std::size_t number = 0; number < session.messages; ++number) {
        Message message = session.make(number);
        message.payload.set("zrreporting_timestamp",
                            begin + static_cast<double>(number) / session.messagesPerSecond);
        wire::Request request = sendRequest(message, kReporterID);
        channel.queue(request);
        if (channel.outstanding() == kInFlight) {
            channel.finish();
        }
    }
    channel.finish();
    service.awaitIdle();
}

} // namespace

LargeStop measureLargeStop(const ServiceProcess::Settings& settings, const LargeSession& session) {
    const ServiceProcess service(settings);
    FrameChannel channel(service.socketPath());
    sendAll(service, channel, session);

    LargeStop stop;
    const Meter stopping(service.pid());
    channel.stopSession(kReporterID);
    channel.finish();
    stop.wallMilliseconds = microseconds(stopping.wall()) / 1000;
    stop.cpuMillisecondsOfReply = microseconds(stopping.service()) / 1000;
    service.awaitIdle();
    stop.cpuMilliseconds = microseconds(stopping.service()) / 1000;
    std::transform(session.summaries.begin(), session.summaries.end(), std::back_inserter(stop.summaries),
                   [&](std::string_view summary) {
                       return service.countEvents("com.vandra.tamblo." + std::string(summary));
                   });
    return stop;
}

void measureOthersWaits(const ServiceProcess::Settings& settings, const LargeSession& session,
                        OthersWaits& waits) {
    using Clock = std::chrono::steady_clock;
    const ServiceProcess service(settings);
    FrameChannel other(service.socketPath());
    other.beginSession(kOther);
    other.finish();
    std::vector<wire::Request> requests = sendRequests(512, kOther);
    FrameChannel channel(service.socketPath());
    sendAll(service, channel, session);

    std::size_t next = 0;
    const auto wait = [&] {
        const Clock::time_point begin = Clock::now();
        (void)other.call(requests[next++ % requests.size()]);
        return microseconds(Clock::now() - begin) / 1000;
    };
    for (const Clock::time_point end = Clock::now() + kAfterwards; Clock::now() < end;) {
        waits.before.push_back(wait());
    }
    std::optional<Clock::time_point> stopped;
    channel.stopSession(kReporterID);
    channel.flush();
    while (!stopped || Clock::now() < *stopped + kAfterwards) {
        (stopped ? waits.afterwards : waits.meanwhile).push_back(wait());
        if (!stopped && channel.hasReply()) {
            channel.finish();
            stopped = Clock::now();
        }
    }
}

void setLargeStop(ResultRow& row, const std::vector<LargeStop>& stops, const OthersWaits& waits,
                  double mostCpuMilliseconds) {
    const auto medianOf = [&](double LargeStop::*figure) {
        std::vector<double> figures;
        std::transform(stops.begin(), stops.end(), std::back_inserter(figures),
                       [&](const LargeStop& stop) { return stop.*figure; });
        return median(figures);
    };
    row.set("stop_cpu_ms", medianOf(&LargeStop::cpuMilliseconds));
    row.set("stop_cpu_ms_until_reply", medianOf(&LargeStop::cpuMillisecondsOfReply));
    row.set("stop_wall_ms", medianOf(&LargeStop::wallMilliseconds));
    row.set("other_round_trips", std::uint64_t{waits.meanwhile.size()});
    row.set("other_p50_ms", quantile(waits.meanwhile, 0.50));
    row.set("other_p99_ms", quantile(waits.meanwhile, 0.99));
    row.set("other_worst_ms", std::max(quantile(waits.meanwhile, 1.0), quantile(waits.afterwards, 1.0)));
    row.set("other_worst_ms_before", quantile(waits.before, 1.0));
    row.holdAgainst("other_worst_ms", "other_worst_ms_before", "other_worst_ratio");
    row.show("other_p99_ms");
    row.set("counted",
            "all sinks and events; the stop alone, until nothing is left to do; the other client's "
            "round trips during a further one");
    row.atMost("stop_cpu_ms", mostCpuMilliseconds);
    row.atMost("other_worst_ms", kLongestWaitMilliseconds);
}

} // namespace tamblo::bench
