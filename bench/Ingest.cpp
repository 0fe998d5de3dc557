#include "Bench.h"
#include "IngestDriver.h"
#include "Meter.h"

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::size_t kInFlight = 64;
constexpr std::size_t kPerSession = 50'000;
constexpr std::size_t kSessionsPerRepetition = 4;
/// Of `ingest_pipelined`, where what a core has in its caches has to come from the other one.
constexpr double kTwoCoresLimit = 2.6;

struct Scenario {
    std::string_view name;
    Variety variety = Variety::distinct;
    std::optional<std::string> eventsInUse;
    double serviceLimit = 0; ///< microseconds of the service's processor time for a message, on one core
    bool isOfAll = false;    ///< the service's main figures: with more targets, and a floor
};

struct Figures {
    std::vector<double> rate, service, client, job;
    std::size_t resident = 0;
};

/// The session's starts and stops are in the figures, and so is what the service does for them. The bare job
/// is done by turns with the service's, so that both meet what else happens on the machine.
Figures drive(const ServiceProcess& service, IngestDriver& driver, BareJob* job, std::size_t repetitions) {
    constexpr auto kMessages = static_cast<double>(kPerSession * kSessionsPerRepetition);
    Figures figures;
    for (std::size_t repetition = 0; repetition < repetitions; ++repetition) {
        if (job != nullptr) {
            figures.job.push_back(job->run(kPerSession).jobMicroseconds);
        }
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
    const std::unique_ptr<BareJob> job = scenario.isOfAll ? bench.bareJob(placement) : nullptr;
    IngestDriver driver(service.socketPath(), messages, kInFlight);
    driver.start();
    driver.send(kPerSession);
    driver.stop();
    const Figures figures = drive(service, driver, job.get(), bench.repetitions(7));

    ResultRow row = bench.row(scenario.name, placement);
    row.set("messages_per_s", median(figures.rate));
    row.set("service_cpu_us_per_message", median(figures.service));
    row.set("client_cpu_us_per_message", median(figures.client));
    row.show("messages_per_s");
    row.show("service_cpu_us_per_message");
    row.set("service_cpu_us_least", quantile(figures.service, 0));
    row.set("floor_messages_per_s", floor.messagesPerSecond);
    row.set("floor_service_cpu_us", floor.readerMicroseconds);
    row.set("floor_client_cpu_us", floor.writerMicroseconds);
    row.set("rss_mib", mebibytes(figures.resident));
    row.set("counted", "all, a stop and a start every 50000 messages included; payloads made beforehand");
    if (placement == Placement::oneCore) {
        row.atMost("service_cpu_us_per_message", scenario.serviceLimit);
    }
    if (scenario.isOfAll) {
        row.set("floor_job_service_cpu_us", median(figures.job));
        row.holdAgainst("service_cpu_us_per_message", "floor_job_service_cpu_us", "over_floor_job");
        row.atMost("client_cpu_us_per_message", 0.5);
    }
    if (scenario.isOfAll && placement == Placement::twoCores) {
        row.atMost("service_cpu_us_per_message", kTwoCoresLimit);
        row.atLeast("messages_per_s", 400'000);
    }
    bench.print(row);
}

void measureAll(Bench& bench, const Scenario& scenario) {
    if (bench.isOnFirstStorage()) {
        measure(bench, scenario, Placement::free);
    }
    measure(bench, scenario, Placement::twoCores);
    measure(bench, scenario, Placement::oneCore);
}

} // namespace

void ingestPipelined(Bench& bench) {
    measureAll(bench, {"ingest_pipelined", Variety::distinct, {}, 2.2, true});
}

void ingestOneEvent(Bench& bench) {
    measureAll(bench, {"ingest_one_event", Variety::distinct, R"(["com.vandra.tamblo.*"])", 1.8});
}

void ingestUnwanted(Bench& bench) {
    measureAll(bench, {"ingest_unwanted", Variety::distinct, "[]", 1.4});
}

void ingestRepeated(Bench& bench) {
    measureAll(bench, {"ingest_repeated", Variety::repeated, {}, 1.0});
}

} // namespace tamblo::bench
