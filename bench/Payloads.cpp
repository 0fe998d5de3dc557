#include "Payloads.h"

#include <array>
#include <chrono>
#include <utility>

namespace tamblo::bench {

namespace {

using client::EventKind;
using client::EventType;
using client::Subsystem;

const std::array<std::pair<client::EventCategory, EventType>, 4> kKinds{{
    {client::category(Subsystem::session, EventKind::playback), EventType::start},
    {client::category(Subsystem::hal, EventKind::io), EventType::state},
    {client::category(Subsystem::routing, EventKind::routeChange), EventType::activate},
    {client::category(Subsystem::dsp, EventKind::performance), EventType::generic},
}};

/// The messages' time begins when the benchmark does.
double epoch() {
    static const double seconds =
        std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
    return seconds;
}

/// By turns the engine's start, and its end with how long it was on.
Message makeHapticsMessage(std::uint64_t number) {
    const bool isStart = number / kHapticsEvery % 2 == 0;
    Message message{
        Dictionary{
            {"EngineState", isStart ? "EngineOn" : "EngineOff"},
            {"engine_identifier", "actuator-main"},
            {"message_counter", static_cast<std::int64_t>(number)},
            {"zrreporting_timestamp", epoch() + static_cast<double>(number) * 0.000731},
        },
        client::category(EventKind::output),
        EventType::joulery,
    };
    if (!isStart) {
        message.payload.set("EngineOnTime", 0.25 + static_cast<double>(number % 1009) * 0.001);
    }
    return message;
}

Message makeIssueMessage(std::uint64_t number) {
    return {
        Dictionary{
            {"issue_type", "silence"},
            {"node", "spatial-mixer-output-1"},
            {"rtaid_client", "com.vandra.melody.player"},
            {"any_channel_silence_seconds", static_cast<std::int64_t>(number % 90)},
            {"message_counter", static_cast<std::int64_t>(number)},
            {"zrreporting_timestamp", epoch() + static_cast<double>(number) * 0.000731},
        },
        client::category(Subsystem::dsp, EventKind::error),
        EventType::issueDetector,
    };
}

} // namespace

Message makeMessage(std::uint64_t number, Variety variety) {
    const std::uint64_t content = variety == Variety::distinct ? number : number / 10;
    const auto step = static_cast<double>(content % 1'000'003);
    const auto& [category, type] = kKinds[content % kKinds.size()];
    return {
        Dictionary{
            {"HostApplicationDisplayID", "com.vandra.melody.player"},
            {"audio_route", "headphones-wireless"},
            {"device_uid", "usb-00000012-stereo-out-0"},
            {"session_identifier", "6f0c1e5a-52d7-4c0e-9d4c-a3c1b7e2f908"},
            {"buffer_frames", 512},
            {"message_counter", static_cast<std::int64_t>(1'000'000 + content)},
            {"sample_rate", 48'000},
            {"io_cycle_load", 0.125 + step * 1.0e-7},
            {"output_latency_ms", 11.6099773 + step * 0.0001},
            {"playback_position_sec", 0.0213333 * step + 0.5},
            {"zrreporting_timestamp", epoch() + static_cast<double>(number) * 0.000731},
            {"is_spatialized", content % 2 == 0},
        },
        category,
        type,
    };
}

std::vector<Message> makeMessages(std::size_t count, Variety variety) {
    std::vector<Message> messages;
    messages.reserve(count);
    for (std::size_t i = 0; i < count; ++i) {
        messages.push_back(makeMessage(i, variety));
    }
    return messages;
}

std::vector<Message> makeMixedMessages(std::size_t count) {
    std::vector<Message> messages = makeMessages(count, Variety::distinct);
    for (std::size_t i = 0; i < count; ++i) {
        if (i % kIssueEvery == 7) {
            messages[i] = makeIssueMessage(i);
        } else if (i % kHapticsEvery == 3) {
            messages[i] = makeHapticsMessage(i);
        }
    }
    return messages;
}

Dictionary sessionConfiguration() {
    return {{"HostApplicationDisplayID", "com.vandra.melody.player"}};
}

wire::Request sendRequest(const Message& message, std::int64_t reporterID) {
    wire::Request request;
    request.method = wire::Method::sendMessage;
    request.dictionary = message.payload;
    request.category = static_cast<std::uint32_t>(message.category);
    request.type = static_cast<std::uint16_t>(message.type);
    request.reporterIDs = {reporterID};
    return request;
}

std::vector<wire::Request> sendRequests(std::size_t count, std::int64_t reporterID) {
    std::vector<wire::Request> requests;
    requests.reserve(count);
    for (std::size_t i = 0; i < count; ++i) {
        requests.push_back(sendRequest(makeMessage(i, Variety::distinct), reporterID));
    }
    return requests;
}

} // namespace tamblo::bench
