#include "Batches.h"
#include "Bench.h"
#include "Meter.h"

#include <algorithm>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::size_t kClients = 5'000;
constexpr std::size_t kBatch = 2'000;

/// The service's processor time for a message that the first client sends to this reporter.
double costOfSending(const ServiceProcess& service, Batches& batches, std::int64_t reporterID,
                     std::size_t repetitions) {
    batches.send(kBatch, reporterID);
    std::vector<double> costs;
    for (std::size_t i = 0; i < repetitions; ++i) {
        const Meter meter(service.pid());
        batches.send(kBatch, reporterID);
        costs.push_back(microseconds(meter.service()) / kBatch);
    }
    return median(costs);
}

} // namespace

/// To one's own session and to that of the client that came last, which takes the longest to find for who
/// searches. With no event in use, so that the finding is not lost in the writing.
void manyClients(Bench& bench) {
    if (raiseDescriptorLimit() < kClients + 100) {
        throw std::runtime_error("the limit of open files does not allow for 5,000 clients");
    }
    ServiceProcess::Settings settings = bench.place(Placement::oneCore);
    settings.eventsInUse = "[]";
    const ServiceProcess service(settings);
    const std::size_t repetitions = bench.repetitions(9);

    std::vector<FrameChannel> clients;
    clients.reserve(kClients);
    const auto connectOne = [&] {
        FrameChannel& channel = clients.emplace_back(service.socketPath());
        channel.createSession(static_cast<std::int64_t>(clients.size()));
        channel.finish();
    };
    connectOne();
    Batches batches(clients.front());
    const double alone = costOfSending(service, batches, 1, repetitions);

    const std::size_t residentBefore = residentBytesOf(service.pid());
    const Meter connecting(service.pid());
    while (clients.size() < kClients) {
        connectOne();
    }
    const double connectMicroseconds = microseconds(connecting.service()) / (kClients - 1);
    const std::size_t resident = residentBytesOf(service.pid());
    const double toItself = costOfSending(service, batches, 1, repetitions);
    const double toTheLast = costOfSending(service, batches, std::int64_t{kClients}, repetitions);

    const Meter leaving(service.pid());
    clients.erase(clients.begin() + 1, clients.end());
    wire::Request request = reporterRequest(wire::Method::getAllReporters, 0);
    std::size_t left = kClients;
    for (int i = 0; i < 1000 && left > 1; ++i) {
        const wire::Reply reply = clients.front().call(request);
        left = reply.result ? reply.result->arrayValue().size() : 0;
    }

    ResultRow row = bench.row("many_clients", Placement::oneCore);
    row.set("clients", std::uint64_t{kClients});
    row.set("service_cpu_us_per_message_alone", alone);
    row.set("service_cpu_us_per_message", std::max(toItself, toTheLast));
    row.set("service_cpu_us_to_itself", toItself);
    row.set("service_cpu_us_to_the_last", toTheLast);
    row.set("ratio", std::max(toItself, toTheLast) / alone);
    row.set("connect_service_cpu_us", connectMicroseconds);
    row.set("leave_service_cpu_us", microseconds(leaving.service()) / (kClients - 1));
    row.set("kib_per_client", static_cast<double>(resident - residentBefore) / 1024 / (kClients - 1));
    row.set("threads", std::uint64_t{threadCountOf(service.pid())});
    row.atMost("ratio", 1.3);
    bench.print(row);
}

} // namespace tamblo::bench
