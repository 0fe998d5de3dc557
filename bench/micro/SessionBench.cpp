#include "../Payloads.h"

#include "platform/Platform.h"
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
    void sendEventLazy(std::string_view, const std::function<Dictionary()>&) override {}
};

class NoTracePoints final : public TracePoints {
public:
    void EmitTracePoint(std::uint32_t) noexcept override {}
};

/// One message through the intake, the redundancy test and the workers; a thousand to a session.
void sessionSend(benchmark::State& state, Variety variety) {
    FakePlatform device(LogLevel::standard);
    NoEvents noEvents;
    NoTracePoints noTracePoints;
    const Platform& fakes = platform();
    installPlatform({fakes.clock, fakes.workQueues, fakes.log, noTracePoints, fakes.deviceProperties,
                     fakes.preferences, fakes.namedNotifications, fakes.processInformation,
                     fakes.deviceConditions, noEvents, fakes.connections});
    device.clock.set(std::chrono::time_point_cast<WallTime::duration>(std::chrono::system_clock::now()));
    const std::vector<Message> messages = makeMessages(kMessages, variety);
    const std::shared_ptr<ZRReportingSession> session = ZRReportingSession::initWithID(7, {1});
    session->updateConfigurationWithContentsOfConfiguration(sessionConfiguration());

    session->start();
    std::size_t i = 0;
    for (auto _ : state) {
        const Message& message = messages[i++ % kMessages];
        session->sendMessage(std::make_shared<ZRReportingSessionMessage>(
            message.payload, static_cast<AudioEventCategory>(message.category),
            static_cast<AudioEventType>(message.type)));
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

} // namespace

} // namespace tamblo::bench
