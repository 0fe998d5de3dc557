#include "../Payloads.h"
#include "../TemporaryDirectory.h"

#include "base/Json.h"
#include "base/TextBuffer.h"
#include "platform/linux/device/LinuxClock.h"
#include "platform/linux/log/LinuxStructuredLog.h"
#include "platform/linux/loop/LinuxWorkQueues.h"
#include "platform/linux/settings/LinuxPreferences.h"
#include "platform/linux/sinks/LinuxAnalyticsEventService.h"

#include <benchmark/benchmark.h>

#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::size_t kMessages = 1000;

void payloadAsJson(benchmark::State& state) {
    const std::vector<Message> messages = makeMessages(kMessages, Variety::distinct);
    TextBuffer out;
    std::size_t i = 0;
    for (auto _ : state) {
        out.clear();
        appendJson(out, messages[i++ % kMessages].payload);
        benchmark::DoNotOptimize(out.data());
    }
    state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * out.size()));
}
BENCHMARK(payloadAsJson);

void timestampAsJson(benchmark::State& state) {
    double seconds = 1'772'366'400.123456;
    TextBuffer out;
    for (auto _ : state) {
        out.clear();
        appendJsonNumber(out, seconds);
        seconds += 0.000731;
        benchmark::DoNotOptimize(out.data());
    }
}
BENCHMARK(timestampAsJson);

/// A message's events as the service writes them, in batches of 64 messages; so many events for each.
void eventsIntoFile(benchmark::State& state) {
    const std::vector<Message> messages = makeMessages(kMessages, Variety::distinct);
    const TemporaryDirectory directory;
    const LinuxClock clock;
    LinuxStructuredLog log;
    const LinuxPreferences preferences(directory.path(), log);
    SinkFiles sinks(directory.path(), log);
    LinuxAnalyticsEventService events(sinks, clock, preferences, log);
    std::size_t i = 0;
    for (auto _ : state) {
        const Message& message = messages[i++ % kMessages];
        events.sendEventLazy("com.vandra.tamblo.Session_PlaybackStart", [&] { return message.payload; });
        if (state.range(0) == 2) {
            events.sendEventLazy("com.vandra.nonlongformaudio.Session_Playback.Start",
                                 [&] { return message.payload; });
        }
        if (i % 64 == 0) {
            sinks.flush();
        }
    }
}
BENCHMARK(eventsIntoFile)->Arg(1)->Arg(2);

} // namespace

} // namespace tamblo::bench
