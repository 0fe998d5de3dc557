#include "Bench.h"
#include "FrameChannel.h"
#include "Meter.h"
#include "Payloads.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <string_view>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::array<std::int64_t, 3> kSessions{1, 1'000, 10'000};
/// Messages times sessions in one measurement: ten messages to the most sessions.
constexpr std::int64_t kDeliveries = 100'000;
constexpr std::size_t kInFlight = 64;

/// A service with so many started sessions, all of one client.
class Audience {
public:
    Audience(const ServiceProcess::Settings& settings, std::int64_t sessions)
        : sessions_(sessions), service_(settings), channel_(service_.socketPath()) {
        for (std::int64_t id = 1; id <= sessions; ++id) {
            channel_.beginSession(id);
            if (id % 100 == 0) {
                channel_.finish();
            }
        }
        channel_.finish();
    }

    /// Microseconds of the service's processor time for one session that gets one message.
    double costOfSending() {
        service_.awaitIdle();
        const Meter meter(service_.pid());
        for (std::int64_t sent = 0; sent < kDeliveries; sent += sessions_) {
            wire::Request request = sendRequest(makeMessage(next_++, Variety::distinct), 0);
            request.reporterIDs.clear();
            channel_.queue(request);
            if (channel_.outstanding() == kInFlight) {
                channel_.finish();
            }
        }
        channel_.finish();
        service_.awaitIdle();
        return microseconds(meter.service()) / static_cast<double>(kDeliveries);
    }

private:
    std::int64_t sessions_;
    ServiceProcess service_;
    FrameChannel channel_;
    std::uint64_t next_ = 0;
};

void measure(Bench& bench, std::string_view name, const ServiceProcess::Settings& settings, bool isWritten) {
    std::array<std::vector<double>, kSessions.size()> costs;
    std::vector<double> ratios;
    for (std::size_t repetition = 0; repetition < bench.repetitions(5); ++repetition) {
        for (std::size_t i = 0; i < kSessions.size(); ++i) {
            Audience audience(settings, kSessions[i]);
            (void)audience.costOfSending();
            costs[i].push_back(audience.costOfSending());
        }
        ratios.push_back(costs[2].back() / costs[1].back());
    }

    ResultRow row = bench.row(name, Placement::oneCore);
    row.set("service_cpu_us_per_session_at_1", median(costs[0]));
    row.set("service_cpu_us_per_session_at_1000", median(costs[1]));
    row.set("service_cpu_us_per_session_at_10000", median(costs[2]));
    row.set("ratio", median(ratios));
    row.show("service_cpu_us_per_session_at_1");
    row.show("service_cpu_us_per_session_at_1000");
    row.show("service_cpu_us_per_session_at_10000");
    row.set("counted", "until nothing is left to do; the ratio is 10000 sessions' over 1000 sessions'");
    row.atMost("ratio", 1.5);
    if (!isWritten) {
        row.atMost("service_cpu_us_per_session_at_1000", 1);
        row.atMost("service_cpu_us_per_session_at_10000", 1);
    }
    bench.print(row);
}

} // namespace

/// Messages that name no session go to all started ones: what that costs for each, in a service that writes
/// nothing of them, and in one as it is.
void broadcast(Bench& bench) {
    ServiceProcess::Settings settings = bench.place(Placement::oneCore);
    settings.retainedBytes = 2U << 30U;
    measure(bench, "broadcast", settings, true);
    if (bench.isOnFirstStorage()) {
        settings.eventsInUse = "[]";
        settings.callQualityBackends = "[]";
        measure(bench, "broadcast_unwritten", settings, false);
    }
}

} // namespace tamblo::bench
