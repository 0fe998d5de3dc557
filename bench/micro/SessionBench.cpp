#include "../Payloads.h"

#include "session/ZRReportingSession.h"
#include "tests/fakes/FakePlatform.h"

#include <benchmark/benchmark.h>

#include <memory>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::size_t kMessages = 1000;

/// Collects nothing: what remains is the session's own work.
class NoEvents final : public AnalyticsEventService {
public:
    [[nodiscard]] bool isEventInUse(std::string_view) override { return false; }
    [[nodiscard]] std::uint64_t inUseGeneration() const noexcept override { return 1; }
    void sendEventsLazy(std::span<const std::string_view>, const std::function<Dictionary()>&) override {}
};

class NoTracePoints final : public TracePoints {
public:
    void EmitTracePoint(std::uint32_t) noexcept override {}
};

/// A device on which nothing but the session costs anything.
class QuietDevice {
public:
    QuietDevice() {
        device_.services().tracePoints = std::make_unique<NoTracePoints>();
        device_.services().analyticsEvents = std::make_unique<NoEvents>();
        device_.clock.set(std::chrono::time_point_cast<WallTime::duration>(std::chrono::system_clock::now()));
    }

    void advance(std::chrono::milliseconds time) { device_.clock.advance(time); }

    [[nodiscard]] WallTime now() const { return device_.clock.now(); }

    [[nodiscard]] std::shared_ptr<ZRReportingSession> startedSession() {
        auto session = device_.makeSession(7, {1});
        // The service type that the call-quality worker refuses: nobody runs the queue that it would fill.
        session->setServiceType(AudioServiceTypeTest);
        session->updateConfigurationWithContentsOfConfiguration(sessionConfiguration());
        session->start();
        return session;
    }

private:
    FakePlatform device_{LogLevel::standard};
};

void send(ZRReportingSession& session, const Message& message) {
    session.sendMessage(std::make_shared<ZRReportingSessionMessage>(
        message.payload, static_cast<AudioEventCategory>(message.category),
        static_cast<AudioEventType>(message.type)));
}

/// One message through the intake, the redundancy test and the workers; a thousand to a session.
void sessionSend(benchmark::State& state, Variety variety) {
    QuietDevice device;
    const std::vector<Message> messages = makeMessages(kMessages, variety);
    const auto session = device.startedSession();
    std::size_t i = 0;
    for (auto _ : state) {
        send(*session, messages[i++ % kMessages]);
        if (i % kMessages == 0) {
            session->stop();
            session->start();
        }
    }
    session->stop();
}

void sessionSendDistinct(benchmark::State& state) {
    sessionSend(state, Variety::distinct);
}
BENCHMARK(sessionSendDistinct);

void sessionSendRepeated(benchmark::State& state) {
    sessionSend(state, Variety::repeated);
}
BENCHMARK(sessionSendRepeated);

/// The stop of a session with messages retained: sorting, the producers' walks, and letting the messages go.
/// One message in a hundred changes what is played on, so that it ends a stretch of each kind.
void sessionStop(benchmark::State& state) {
    constexpr std::chrono::milliseconds kBetweenMessages{20};
    QuietDevice device;
    const auto session = device.startedSession();
    const auto count = static_cast<std::uint64_t>(state.range(0));
    for (auto _ : state) {
        state.PauseTiming();
        for (std::uint64_t i = 0; i < count; ++i) {
            Message message = makeMessage(i, Variety::distinct);
            device.advance(kBetweenMessages);
            message.payload.set("zrreporting_timestamp", secondsSince1970(device.now()));
            if (i % 100 == 0) {
                message.payload.merge({{"session_output_running", true},
                                       {"session_input_running", true},
                                       {"kaleen_session", 1},
                                       {"QVSessionVolume", 0.5},
                                       {"active_devices", i % 200 == 0 ? "Speaker" : "Headphones"}});
            }
            send(*session, message);
        }
        state.ResumeTiming();
        session->stop();
        session->start();
    }
    state.SetItemsProcessed(state.iterations() * state.range(0));
}
BENCHMARK(sessionStop)->Arg(10'000)->Arg(100'000)->Unit(benchmark::kMillisecond);

} // namespace

} // namespace tamblo::bench
