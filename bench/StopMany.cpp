#include "Bench.h"
#include "FrameChannel.h"
#include "Meter.h"
#include "Payloads.h"

#include <algorithm>
#include <fstream>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::int64_t kSessions = 10'000;
constexpr std::uint64_t kMessages = 5; ///< of each session
constexpr std::int64_t kOther = kSessions + 1;
constexpr std::chrono::seconds kLimit{60};
constexpr const char* kSummary = "com.vandra.tamblo.Session_Generic.Summary";
/// The sessions' summaries are written under both of their names, the messages are not.
constexpr const char* kSummaryEvents = R"(["com.vandra.tamblo.Session_Generic.Summary",
                                          "com.vandra.nonlongformaudio.Session_Generic.Summary"])";

/// Waits for the line that ends a client, from now on.
class ClientEnd {
public:
    explicit ClientEnd(const std::string& logPath) : log_(logPath, std::ios::binary) {
        log_.seekg(0, std::ios::end);
    }
    [[nodiscard]] bool hasCome() {
        std::string line;
        while (std::getline(log_, line) && !log_.eof()) {
            if ((begun_ + line).find(" from the server client list") != std::string::npos) {
                return true;
            }
            begun_.clear();
        }
        // What there is of a line that is being written.
        begun_ += line;
        log_.clear();
        return false;
    }

private:
    std::ifstream log_;
    std::string begun_;
};

struct Figures {
    std::vector<double> roundTrips; ///< milliseconds
    double cpuSeconds = 0;          ///< of the service, until all is stopped
    double wallSeconds = 0;
    std::size_t summaries = 0;
};

void startSessions(FrameChannel& channel) {
    for (std::int64_t id = 1; id <= kSessions; ++id) {
        channel.beginSession(id);
        for (std::uint64_t message = 0; message < kMessages; ++message) {
            wire::Request request = sendRequest(makeMessage(message, Variety::distinct), id);
            channel.queue(request);
        }
        if (id % 100 == 0) {
            channel.finish();
        }
    }
}

Figures measure(const ServiceProcess::Settings& settings) {
    const ServiceProcess service(settings);
    FrameChannel other(service.socketPath());
    other.beginSession(kOther);
    other.finish();
    std::vector<wire::Request> requests = sendRequests(512, kOther);
    std::optional<FrameChannel> leaving(service.socketPath());
    startSessions(*leaving);

    Figures figures;
    ClientEnd end(service.logPath());
    const Meter stopping(service.pid());
    leaving.reset();
    for (std::size_t i = 0; !end.hasCome(); ++i) {
        if (stopping.wall() > kLimit) {
            throw std::runtime_error("the end of the client takes too long");
        }
        const auto start = std::chrono::steady_clock::now();
        (void)other.call(requests[i % requests.size()]);
        figures.roundTrips.push_back(microseconds(std::chrono::steady_clock::now() - start) / 1000);
    }
    figures.cpuSeconds = secondsOf(stopping.service());
    figures.wallSeconds = secondsOf(stopping.wall());
    // What was derived is in the file before the next reply.
    (void)other.call(requests.front());
    figures.summaries = service.countEvents(kSummary);
    return figures;
}

} // namespace

/// Both clients are this thread's: one goes, the other keeps sending one message and waiting for its reply.
void stopMany(Bench& bench) {
    ServiceProcess::Settings settings = bench.place(Placement::oneCore);
    settings.eventsInUse = kSummaryEvents;
    std::vector<double> roundTrips, cpu, wall;
    std::size_t summaries = kSessions;
    for (std::size_t i = 0; i < bench.repetitions(3); ++i) {
        const Figures figures = measure(settings);
        roundTrips.insert(roundTrips.end(), figures.roundTrips.begin(), figures.roundTrips.end());
        cpu.push_back(figures.cpuSeconds);
        wall.push_back(figures.wallSeconds);
        summaries = std::min(summaries, figures.summaries);
    }

    ResultRow row = bench.row("stop_many", Placement::oneCore);
    row.set("sessions", static_cast<std::uint64_t>(kSessions));
    row.set("messages_per_session", kMessages);
    row.set("summaries", std::uint64_t{summaries});
    row.set("round_trips", std::uint64_t{roundTrips.size()});
    row.set("p50_ms", quantile(roundTrips, 0.50));
    row.set("p99_ms", quantile(roundTrips, 0.99));
    row.set("max_ms", quantile(roundTrips, 1.0));
    row.set("stop_cpu_s", median(cpu));
    row.set("stop_wall_s", median(wall));
    row.atMost("p99_ms", 50);
    row.atLeast("summaries", kSessions);
    bench.print(row);
}

} // namespace tamblo::bench
