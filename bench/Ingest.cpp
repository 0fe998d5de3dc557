#include "Bench.h"
#include "IngestDriver.h"
#include "Meter.h"

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::size_t kInFlight = 64;
constexpr std::size_t kPerSession = 50'000;
constexpr std::size_t kSessionsPerRepetition = 4;

struct Scenario {
    std::string_view name;
    Variety variety = Variety::distinct;
    std::optional<std::string> eventsInUse;
    double serviceLimit = 0; ///< microseconds of the service's processor time for a message
    bool hasRateAndClientLimit = false;
};

struct Figures {
    std::vector<double> rate, service, client;
    std::size_t resident = 0;
};

/// The session's starts and stops are in the figures, and so is what the service does for them.
Figures drive(const ServiceProcess& service, IngestDriver& driver, std::size_t repetitions) {
    constexpr auto kMessages = static_cast<double>(kPerSession * kSessionsPerRepetition);
    Figures figures;
    for (std::size_t repetition = 0; repetition < repetitions; ++repetition) {
        const Meter meter(service.pid());
        for (std::size_t i = 0; i < kSessionsPerRepetition; ++i) {
            driver.start();
            driver.send(kPerSession);
            if (i + 1 == kSessionsPerRepetition) {
                figures.resident = std::max(figures.resident, residentBytesOf(service.pid()));
            }
            driver.stop();
        }
        figures.rate.push_back(kMessages / secondsOf(meter.wall()));
        figures.service.push_back(microseconds(meter.service()) / kMessages);
        figures.client.push_back(microseconds(meter.client()) / kMessages);
    }
    return figures;
}

void measure(Bench& bench, const Scenario& scenario, Placement placement) {
    const SocketFloor floor = bench.socketFloor(placement);
    ServiceProcess::Settings settings = bench.place(placement);
    settings.eventsInUse = scenario.eventsInUse;
    const ServiceProcess service(settings);
    const std::vector<Message> messages = makeMessages(1000, scenario.variety);
    IngestDriver driver(service.socketPath(), messages, kInFlight);
    driver.start();
    driver.send(kPerSession);
    driver.stop();
    const Figures figures = drive(service, driver, bench.repetitions(7));

    ResultRow row(scenario.name);
    row.set("messages_per_s", median(figures.rate));
    row.set("service_cpu_us_per_message", median(figures.service));
    row.set("client_cpu_us_per_message", median(figures.client));
    row.set("service_cpu_us_least", quantile(figures.service, 0));
    row.set("floor_messages_per_s", floor.messagesPerSecond);
    row.set("floor_service_cpu_us", floor.readerMicroseconds);
    row.set("floor_client_cpu_us", floor.writerMicroseconds);
    row.set("rss_mib", mebibytes(figures.resident));
    row.set("counted", "all, a stop and a start every 50000 messages included; payloads made beforehand");
    row.set("placement", describe(placement));
    row.atMost("service_cpu_us_per_message", scenario.serviceLimit);
    if (scenario.hasRateAndClientLimit) {
        row.atMost("client_cpu_us_per_message", 0.5);
        if (placement != Placement::oneCore) {
            row.atLeast("messages_per_s", 400'000);
        }
    }
    bench.print(row);
}

void measureAll(Bench& bench, const Scenario& scenario) {
    for (const Placement placement : {Placement::free, Placement::twoCores, Placement::oneCore}) {
        measure(bench, scenario, placement);
    }
}

} // namespace

void ingestPipelined(Bench& bench) {
    measureAll(bench, {"ingest_pipelined", Variety::distinct, {}, 2.5, true});
}

void ingestOneEvent(Bench& bench) {
    measureAll(bench, {"ingest_one_event", Variety::distinct, R"(["com.vandra.tamblo.*"])", 1.8});
}

void ingestUnwanted(Bench& bench) {
    measureAll(bench, {"ingest_unwanted", Variety::distinct, "[]", 1.2});
}

void ingestRepeated(Bench& bench) {
    measureAll(bench, {"ingest_repeated", Variety::repeated, {}, 1.0});
}

} // namespace tamblo::bench
