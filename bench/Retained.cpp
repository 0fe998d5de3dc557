#include "Batches.h"
#include "Bench.h"
#include "Meter.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <thread>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::int64_t kReporterID = 7;
constexpr std::size_t kFew = 1'000;
constexpr std::size_t kMany = 1'000'000;
constexpr std::size_t kBatch = 5'000;
/// Of the memory that a stopped session took, the most that the service may keep, and how long it is waited
/// for.
constexpr double kMostKeptMebibytes = 10;
constexpr std::chrono::seconds kLongestWait{10};

struct GivenBack {
    std::size_t resident = 0;
    double seconds = 0; ///< from the stop's reply
};

/// Until the service is about as small as it was.
GivenBack awaitGivenBack(const ServiceProcess& service, std::size_t residentBefore) {
    const Meter meter(service.pid());
    for (;;) {
        const GivenBack now{residentBytesOf(service.pid()), secondsOf(meter.wall())};
        if (mebibytes(now.resident) <= mebibytes(residentBefore) + kMostKeptMebibytes ||
            meter.wall() > kLongestWait) {
            return now;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
}

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

    service.awaitIdle();
    const std::size_t residentBefore = residentBytesOf(service.pid());
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
    const double stopMilliseconds = microseconds(stopping.wall()) / 1000;
    const GivenBack givenBack = awaitGivenBack(service, residentBefore);

    ResultRow row = bench.row("retained", Placement::oneCore);
    row.set("service_cpu_us_per_message_at_1000", median(few));
    row.set("service_cpu_us_per_message", median(many));
    row.set("ratio", median(many) / median(few));
    row.set("bytes_per_message",
            static_cast<double>(residentAtMany - residentAtFew) / static_cast<double>(kMany - kFew));
    row.set("rss_mib", mebibytes(residentAtMany));
    row.set("stop_ms", stopMilliseconds);
    row.set("rss_mib_before", mebibytes(residentBefore));
    row.set("rss_mib_after_stop", mebibytes(givenBack.resident));
    row.set("rss_mib_not_given_back", mebibytes(givenBack.resident) - mebibytes(residentBefore));
    row.set("given_back_after_s", givenBack.seconds);
    row.show("service_cpu_us_per_message");
    row.show("rss_mib_before");
    row.show("rss_mib_after_stop");
    row.atMost("ratio", 1.3);
    row.atMost("bytes_per_message", 330);
    row.atMost("rss_mib_not_given_back", kMostKeptMebibytes);
    bench.print(row);
}

} // namespace tamblo::bench
