#include "Bench.h"
#include "IngestDriver.h"
#include "Meter.h"

#include <optional>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::size_t kInFlight = 64;
/// As many as leave the sinks' files unrotated when they are counted; divides into rounds of the messages.
constexpr std::size_t kCounted = 20'000;
constexpr std::size_t kPerSession = 50'000;
constexpr std::size_t kSessionsPerRepetition = 4;
constexpr std::size_t kDistinct = 1000;

/// What a service has written, in lines.
struct Lines {
    std::size_t events = 0;
    std::size_t power = 0;
    std::size_t metrics = 0;
    std::size_t callQuality = 0; ///< messages, the session's summary among them

    [[nodiscard]] static Lines of(const ServiceProcess& service) {
        return {.events = service.countLines("analytics-events.jsonl", "\"payload\""),
                .power = service.countLines("power-events.jsonl", "Korvell_Haptics_"),
                .metrics = service.countLines("diagnostics-metrics.jsonl", "\"metric\":5963779,"),
                .callQuality = service.countLines("call-quality.jsonl", "\"op\":\"message\"")};
    }
    /// At least; what the session derives comes on top, under two names for events.
    [[nodiscard]] static Lines expectedOf(std::size_t messages) {
        const std::size_t haptics = messages / kHapticsEvery;
        return {.events = 2 * messages,
                .power = haptics + haptics / 2,
                .metrics = messages / kIssueEvery,
                .callQuality = messages + 1};
    }
};

struct Figures {
    std::vector<double> rate, service, client;
    std::size_t resident = 0;
};

Figures drive(const ServiceProcess& service, IngestDriver& driver, std::size_t repetitions) {
    constexpr auto kMessages = static_cast<double>(kPerSession * kSessionsPerRepetition);
    Figures figures;
    for (std::size_t repetition = 0; repetition < repetitions; ++repetition) {
        const Meter meter(service.pid());
        for (std::size_t i = 0; i < kSessionsPerRepetition; ++i) {
            driver.start();
            driver.send(kPerSession);
            driver.stop();
        }
        figures.rate.push_back(kMessages / secondsOf(meter.wall()));
        figures.client.push_back(microseconds(meter.client()) / kMessages);
        service.awaitIdle();
        figures.service.push_back(microseconds(meter.service()) / kMessages);
    }
    figures.resident = peakResidentBytesOf(service.pid());
    return figures;
}

/// Most that a message may cost on an internal build, in what it costs on an ordinary one.
constexpr double kInternalBuildRatio = 1.5;

/// The processor time that a message costs. With that of an ordinary build given, an internal build is
/// measured.
double measure(Bench& bench, Placement placement, std::optional<double> ordinaryBuild = std::nullopt) {
    ServiceProcess::Settings settings = bench.place(placement);
    settings.isInternalBuild = ordinaryBuild.has_value();
    const ServiceProcess service(settings);
    const std::vector<Message> messages = makeMixedMessages(kDistinct);
    IngestDriver driver(service.socketPath(), messages, kInFlight);
    driver.start();
    driver.send(kCounted);
    driver.stop();
    service.awaitIdle();
    const Lines written = Lines::of(service);
    const Lines expected = Lines::expectedOf(kCounted);
    const Figures figures = drive(service, driver, bench.repetitions(5));

    const double cost = median(figures.service);
    ResultRow row = bench.row(ordinaryBuild ? "ingest_all_sinks_internal" : "ingest_all_sinks", placement);
    row.set("messages_per_s", median(figures.rate));
    row.set("service_cpu_us_per_message", cost);
    row.set("client_cpu_us_per_message", median(figures.client));
    row.show("messages_per_s");
    row.show("service_cpu_us_per_message");
    row.set("service_cpu_us_least", quantile(figures.service, 0));
    row.set("peak_rss_mib", mebibytes(figures.resident));
    row.set("lines_of_messages", std::uint64_t{kCounted});
    row.set("event_lines", std::uint64_t{written.events});
    row.set("power_lines", std::uint64_t{written.power});
    row.set("metric_lines", std::uint64_t{written.metrics});
    row.set("call_quality_lines", std::uint64_t{written.callQuality});
    row.set("counted", "all, until every queue is worked off; a stop and a start every 50000 messages");
    if (ordinaryBuild) {
        row.set("over_ordinary_build", cost / *ordinaryBuild);
        row.atMost("over_ordinary_build", kInternalBuildRatio);
    }
    if (placement == Placement::oneCore) {
        row.atMost("service_cpu_us_per_message", ordinaryBuild ? 3.3 : 2.8);
    }
    row.require("the lines of every message in every sink",
                written.events >= expected.events && written.power == expected.power &&
                    written.metrics == expected.metrics && written.callQuality >= expected.callQuality);
    bench.print(row);
    return cost;
}

} // namespace

/// What a message costs when all of its sinks want it, the call-quality service's queue included: on an
/// ordinary build, and on an internal one, whose sessions are captured, traced and written to files as well.
void ingestAllSinks(Bench& bench) {
    for (const Placement placement : {Placement::free, Placement::twoCores, Placement::oneCore}) {
        if (placement == Placement::free && !bench.isOnFirstStorage()) {
            continue;
        }
        const double ordinary = measure(bench, placement);
        static_cast<void>(measure(bench, placement, ordinary));
    }
}

} // namespace tamblo::bench
