#include "../Payloads.h"

#include <benchmark/benchmark.h>

#include <array>
#include <string>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::size_t kMessages = 1000;
constexpr std::array<std::string_view, 3> kKeysOfTimes{"processuptime_ms", "systemuptime_sec",
                                                       "zrreporting_timestamp"};

/// What a session knows of earlier messages: these keys, and as many others.
Dictionary previousValues() {
    Dictionary values = makeMessage(0, Variety::distinct).payload;
    for (int i = 0; i < 12; ++i) {
        values.set("earlier_message_key_" + std::to_string(i), i);
    }
    return values;
}

void mergeSameKeys(benchmark::State& state) {
    const std::vector<Message> messages = makeMessages(kMessages, Variety::distinct);
    Dictionary values = messages[0].payload;
    values.merge(messages[1].payload);
    std::size_t i = 0;
    for (auto _ : state) {
        values.merge(messages[i++ % kMessages].payload);
        benchmark::DoNotOptimize(values);
    }
}
BENCHMARK(mergeSameKeys);

void mergeIntoMoreKeys(benchmark::State& state) {
    const std::vector<Message> messages = makeMessages(kMessages, Variety::distinct);
    Dictionary values = previousValues();
    std::size_t i = 0;
    for (auto _ : state) {
        values.merge(messages[i++ % kMessages].payload);
        benchmark::DoNotOptimize(values);
    }
}
BENCHMARK(mergeIntoMoreKeys);

void mergeNewKeys(benchmark::State& state) {
    const Dictionary payload = makeMessage(1, Variety::distinct).payload;
    Dictionary others;
    for (int i = 0; i < 12; ++i) {
        others.set("earlier_message_key_" + std::to_string(i), i);
    }
    for (auto _ : state) {
        Dictionary values = others;
        values.merge(payload);
        benchmark::DoNotOptimize(values);
    }
}
BENCHMARK(mergeNewKeys);

void redundancyTest(benchmark::State& state, const Dictionary& earlier, const Dictionary& payload,
                    bool expected) {
    for (auto _ : state) {
        const bool isRepetition = earlier.equalsIgnoring(payload, kKeysOfTimes);
        if (isRepetition != expected) {
            state.SkipWithError("the wrong answer");
            break;
        }
        benchmark::DoNotOptimize(isRepetition);
    }
}

void redundancyTestEqual(benchmark::State& state) {
    redundancyTest(state, makeMessage(0, Variety::repeated).payload,
                   makeMessage(1, Variety::repeated).payload, true);
}
BENCHMARK(redundancyTestEqual);

void redundancyTestDifferent(benchmark::State& state) {
    redundancyTest(state, makeMessage(0, Variety::distinct).payload,
                   makeMessage(4, Variety::distinct).payload, false);
}
BENCHMARK(redundancyTestDifferent);

} // namespace

} // namespace tamblo::bench
