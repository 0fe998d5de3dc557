#include "../Payloads.h"

#include "base/TextBuffer.h"
#include "wire/Protocol.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <benchmark/benchmark.h>

#include <array>
#include <vector>

namespace tamblo::bench {

namespace {

constexpr std::size_t kMessages = 1000;

std::vector<TextBuffer> frames() {
    std::vector<TextBuffer> all(kMessages);
    std::uint64_t id = 1000;
    for (std::size_t i = 0; i < kMessages; ++i) {
        wire::Request request = sendRequest(makeMessage(i, Variety::distinct), 7);
        request.id = ++id;
        (void)wire::appendRequestFrame(all[i], request);
    }
    return all;
}

void decodeOneFrame(benchmark::State& state) {
    const std::vector<TextBuffer> all = frames();
    KeySetCache keySets;
    wire::Request request;
    std::size_t i = 0;
    for (auto _ : state) {
        const auto item = all[i++ % kMessages].bytes().subspan(wire::kLengthBytes);
        if (wire::decodeRequest(item, keySets, request)) {
            state.SkipWithError("refused");
            break;
        }
        benchmark::DoNotOptimize(request);
    }
    state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * all[0].size()));
}
BENCHMARK(decodeOneFrame);

void encodeOneFrame(benchmark::State& state) {
    std::vector<wire::Request> requests;
    for (const Message& message : makeMessages(kMessages, Variety::distinct)) {
        requests.push_back(sendRequest(message, 7));
        requests.back().id = requests.size();
    }
    TextBuffer out;
    std::size_t i = 0;
    for (auto _ : state) {
        out.clear();
        benchmark::DoNotOptimize(wire::appendRequestFrame(out, requests[i++ % kMessages]));
    }
    state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * out.size()));
}
BENCHMARK(encodeOneFrame);

void encodeByTheClientLibrary(benchmark::State& state) {
    const std::vector<Message> messages = makeMessages(kMessages, Variety::distinct);
    const std::array<std::int64_t, 1> reporterIDs{7};
    TextBuffer out;
    std::size_t i = 0;
    for (auto _ : state) {
        out.clear();
        const Message& message = messages[i++ % kMessages];
        benchmark::DoNotOptimize(wire::appendRequestFrame(
            out, wire::RequestView{.method = wire::Method::sendMessage,
                                   .id = 0,
                                   .dictionary = message.payload,
                                   .category = static_cast<std::uint32_t>(message.category),
                                   .type = static_cast<std::uint16_t>(message.type),
                                   .reporterIDs = reporterIDs}));
    }
}
BENCHMARK(encodeByTheClientLibrary);

void encodeOneReply(benchmark::State& state) {
    TextBuffer out;
    std::uint64_t id = 0;
    for (auto _ : state) {
        out.clear();
        wire::appendNullReply(out, ++id);
        benchmark::DoNotOptimize(out.data());
    }
}
BENCHMARK(encodeOneReply);

} // namespace

} // namespace tamblo::bench
