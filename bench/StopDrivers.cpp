#include "Bench.h"
#include "FrameChannel.h"
#include "Meter.h"
#include "Payloads.h"

#include <chrono>
#include <cstdint>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

namespace tamblo::bench {

namespace {

/// As many as the service traces at a time, so that all of them stop alike.
constexpr std::int64_t kSessions = 32;
constexpr std::uint64_t kMessages = 5; ///< of each session
/// What a driver has published for that long is not read again for each session.
constexpr std::chrono::milliseconds kSettled{100};

/// An internal build, and a client with some sessions that are stopped together, over and over.
class Device {
public:
    explicit Device(const ServiceProcess::Settings& settings)
        : hasDrivers_(settings.hasDrivers), service_(settings), channel_(service_.socketPath()) {
        for (std::int64_t id = 1; id <= kSessions; ++id) {
            channel_.createSession(id);
        }
        channel_.finish();
    }

    /// Microseconds of the service's processor time for one stop, with what it leaves to do for later.
    double stopCost() {
        for (std::int64_t id = 1; id <= kSessions; ++id) {
            channel_.startSession(id);
            for (std::uint64_t i = 0; i < kMessages; ++i) {
                wire::Request request = sendRequest(makeMessage(next_++, Variety::distinct), id);
                channel_.queue(request);
            }
        }
        channel_.finish();
        if (hasDrivers_) {
            service_.advanceDrivers();
        }
        std::this_thread::sleep_for(kSettled);
        const Meter stopping(service_.pid());
        for (std::int64_t id = 1; id <= kSessions; ++id) {
            channel_.stopSession(id);
        }
        channel_.finish();
        service_.awaitIdle();
        return microseconds(stopping.service()) / kSessions;
    }

    [[nodiscard]] std::size_t countOf(std::string_view kind) const {
        return service_.countEvents("com.vandra.tamblo.Chanlog." + std::string(kind));
    }

private:
    const bool hasDrivers_;
    ServiceProcess service_;
    FrameChannel channel_;
    std::uint64_t next_ = 0;
};

} // namespace

/// What the messages cost that a stop sends itself, one of each kind of statistics: what stops with drivers
/// that have gained something cost more than those without. Two of the three have more than 64 keys, which is
/// the largest key set that the service remembers.
void stopDrivers(Bench& bench) {
    ServiceProcess::Settings settings = bench.place(Placement::oneCore);
    settings.isInternalBuild = true;
    Device with(settings);
    settings.hasDrivers = false;
    Device without(settings);
    (void)with.stopCost();
    (void)without.stopCost();
    const std::size_t stops = bench.repetitions(15);
    std::vector<double> costsWith, costsWithout, differences;
    for (std::size_t i = 0; i < stops; ++i) {
        costsWith.push_back(with.stopCost());
        costsWithout.push_back(without.stopCost());
        differences.push_back(costsWith.back() - costsWithout.back());
    }

    const std::size_t expected = (stops + 1) * kSessions;
    ResultRow row = bench.row("stop_drivers", Placement::oneCore);
    row.set("stops", std::uint64_t{stops * kSessions});
    row.set("stop_cpu_us_with_drivers", median(costsWith));
    row.set("stop_cpu_us_without", median(costsWithout));
    row.set("drivers_cpu_us", median(differences));
    row.show("stop_cpu_us_with_drivers");
    row.show("stop_cpu_us_without");
    row.set("counted",
            "32 stops at a time, until nothing is left to do; the statistics are read once for them");
    row.atMost("drivers_cpu_us", 100);
    row.require("three messages of each stop with drivers",
                with.countOf("Simple") == expected && with.countOf("State") == expected &&
                    with.countOf("Histogram") == expected && without.countOf("Simple") == 0);
    bench.print(row);
}

} // namespace tamblo::bench
