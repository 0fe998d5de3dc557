#include "Bench.h"
#include "FrameChannel.h"
#include "Meter.h"
#include "Payloads.h"
#include "base/Json.h"

#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <string>
#include <variant>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::int64_t kReporterID = 7;
constexpr std::size_t kMessages = 100'000;
constexpr std::size_t kInFlight = 100;

struct Figures {
    double cpuSeconds = 0; ///< of the service
    double wallSeconds = 0;
    double fileMebibytes = 0;
    double peakMebibytes = 0; ///< by which the stop raised what was ever resident
    std::size_t records = 0;
};

/// What the one summary file of the service says.
std::string summaryFileOf(const ServiceProcess& service) {
    for (const auto& entry :
         std::filesystem::directory_iterator(service.logsDirectory() + "/DiagnosticLogs/Audio/Reporting")) {
        std::ostringstream text;
        text << std::ifstream(entry.path(), std::ios::binary).rdbuf();
        return std::move(text).str();
    }
    throw std::runtime_error("there is no summary file");
}

/// How many records the file has; it must be an array of objects of one record each.
std::size_t recordsIn(const std::string& text) {
    const auto outcome = readJson(text);
    if (const auto* error = std::get_if<JsonError>(&outcome)) {
        throw std::runtime_error("the summary file is no JSON: line " + std::to_string(error->line) + ": " +
                                 error->message);
    }
    std::size_t count = 0;
    for (const Value& object : std::get<Value>(outcome).arrayValue()) {
        const Dictionary& named = object.dictionaryValue();
        count += named.size() == 1 && named.valueAt(0).dictionaryValue().contains("isSessionStarted") ? 1 : 0;
    }
    return count;
}

Figures measure(const ServiceProcess::Settings& settings) {
    const ServiceProcess service(settings);
    FrameChannel channel(service.socketPath());
    channel.beginSession(kReporterID, client::ServiceType::test);
    for (std::size_t number = 0; number < kMessages; ++number) {
        wire::Request request = sendRequest(makeMessage(number, Variety::distinct), kReporterID);
        channel.queue(request);
        if (number % kInFlight == kInFlight - 1) {
            channel.finish();
        }
    }
    channel.finish();

    Figures figures;
    const std::size_t peak = peakResidentBytesOf(service.pid());
    const Meter stopping(service.pid());
    channel.stopSession(kReporterID);
    channel.finish();
    figures.wallSeconds = secondsOf(stopping.wall());
    figures.cpuSeconds = secondsOf(stopping.service());
    figures.peakMebibytes = mebibytes(peakResidentBytesOf(service.pid()) - peak);
    const std::string file = summaryFileOf(service);
    figures.fileMebibytes = mebibytes(file.size());
    figures.records = recordsIn(file);
    return figures;
}

} // namespace

/// The stop of a session of the type "test", which writes all that the session holds into a file.
void summaryJson100k(Bench& bench) {
    ServiceProcess::Settings settings = bench.place(Placement::oneCore);
    settings.eventsInUse = "[]";
    std::vector<double> cpu, wall;
    Figures figures;
    for (std::size_t i = 0; i < bench.repetitions(5); ++i) {
        figures = measure(settings);
        cpu.push_back(figures.cpuSeconds);
        wall.push_back(figures.wallSeconds);
    }

    ResultRow row = bench.row("summary_json_100k", Placement::oneCore);
    row.set("messages", std::uint64_t{kMessages});
    row.set("records", std::uint64_t{figures.records});
    row.set("file_mib", figures.fileMebibytes);
    row.set("stop_cpu_s", median(cpu));
    row.set("stop_cpu_s_least", quantile(cpu, 0));
    row.set("stop_wall_s", median(wall));
    row.set("peak_growth_mib", figures.peakMebibytes);
    row.atMost("stop_cpu_s", 0.4);
    row.atLeast("records", kMessages);
    bench.print(row);
}

} // namespace tamblo::bench
