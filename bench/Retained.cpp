#include "Batches.h"
#include "Bench.h"
#include "Meter.h"

#include <cstddef>
#include <cstdint>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::int64_t kReporterID = 7;
constexpr std::size_t kFew = 1'000;
constexpr std::size_t kMany = 1'000'000;
constexpr std::size_t kBatch = 5'000;

} // namespace

/// With no event in use, what is left per message is the session's own work, which must not grow.
void retained(Bench& bench) {
    ServiceProcess::Settings settings = bench.place(Placement::oneCore);
    settings.eventsInUse = "[]";
    settings.retainedBytes = 2U << 30U;
    const ServiceProcess service(settings);
    FrameChannel channel(service.socketPath());
    channel.createSession(kReporterID);
    Batches batches(channel);
    const std::size_t repetitions = bench.repetitions(11);

    std::vector<double> few;
    for (std::size_t i = 0; i < repetitions; ++i) {
        channel.startSession(kReporterID);
        batches.send(kFew, kReporterID);
        const Meter meter(service.pid());
        batches.send(kBatch, kReporterID);
        few.push_back(microseconds(meter.service()) / kBatch);
        channel.stopSession(kReporterID);
        channel.finish();
    }

    channel.startSession(kReporterID);
    batches.send(kFew, kReporterID);
    const std::size_t residentAtFew = residentBytesOf(service.pid());
    batches.send(kMany - kFew, kReporterID);
    const std::size_t residentAtMany = residentBytesOf(service.pid());
    std::vector<double> many;
    for (std::size_t i = 0; i < repetitions; ++i) {
        const Meter meter(service.pid());
        batches.send(kBatch, kReporterID);
        many.push_back(microseconds(meter.service()) / kBatch);
    }
    const Meter stopping(service.pid());
    channel.stopSession(kReporterID);
    channel.finish();

    ResultRow row("retained");
    row.set("service_cpu_us_per_message_at_1000", median(few));
    row.set("service_cpu_us_per_message", median(many));
    row.set("ratio", median(many) / median(few));
    row.set("bytes_per_message",
            static_cast<double>(residentAtMany - residentAtFew) / static_cast<double>(kMany - kFew));
    row.set("rss_mib", mebibytes(residentAtMany));
    row.set("stop_ms", microseconds(stopping.wall()) / 1000);
    row.set("rss_mib_after_stop", mebibytes(residentBytesOf(service.pid())));
    row.set("placement", describe(Placement::oneCore));
    row.atMost("ratio", 1.3);
    row.atMost("bytes_per_message", 700);
    bench.print(row);
}

} // namespace tamblo::bench
