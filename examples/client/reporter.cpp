// A player that reports a session in C++: that it started, that somebody turned it up, that it stopped.
//
//     c++ -std=c++20 reporter.cpp $(pkg-config --cflags --libs tamblo) -o reporter && ./reporter
//
// It says what is wrong and ends, within seconds, where no service answers.

#include <tamblo/client/Client.h>

#include <array>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <ctime>
#include <future>
#include <utility>

using namespace tamblo::client;

namespace {

constexpr std::int64_t kReporter = 7;
constexpr std::array<std::int64_t, 1> kReporters{kReporter};
constexpr std::chrono::seconds kPatience{5};

/// Whether the request was answered in time, and without an error.
template <typename T> bool succeeded(Client& client, std::future<Result<T>> reply) {
    if (!client.wait(reply, kPatience)) {
        std::fputs("reporter: the service did not answer in time\n", stderr);
        return false;
    }
    const Result<T> result = reply.get();
    if (!result.ok()) {
        std::fprintf(stderr, "reporter: %s\n", result.error->message.c_str());
    }
    return result.ok();
}

bool reportSession(Client& client) {
    const EventCategory playback = category(Subsystem::session, EventKind::playback);
    // Nothing waits for what has no reply wanted; the stop is answered when all before it has been recorded.
    client.setServiceType(ServiceType::longFormAudio, kReporter, nullptr);
    client.startReportingSessionForID(kReporter, nullptr);
    // Each has the time of what it tells of, in seconds since 1970.
    const double began = static_cast<double>(std::time(nullptr)) - 12.5;
    client.post({{"zrreporting_timestamp", began},
                 {"active_devices", "Speaker"},
                 {"session_output_running", true},
                 {"QVSessionVolume", 0.5},
                 {"options", tamblo::Array{"AllowBluetooth", "AllowAirPlay"}}},
                playback, EventType::start, kReporters);
    client.post({{"zrreporting_timestamp", began + 5.0}, {"QVSessionVolume", 0.75}},
                category(EventKind::volume), EventType::generic, kReporters);
    client.post({{"zrreporting_timestamp", began + 12.5},
                 {"session_output_running", false},
                 {"session_duration", 12.5}},
                playback, EventType::stop, kReporters);
    return succeeded(client, client.stopReportingSessionForID(kReporter));
}

} // namespace

int main() {
    Client client({.reconnect = false});
    return succeeded(client, client.createReportingSession(kReporter)) && reportSession(client) ? 0 : 1;
}
