#include "tests/service/RealService.h"

#include <algorithm>
#include <cmath>
#include <future>

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

// A session that was played, is recorded, and is played again: the bench sees what the field saw.

namespace tamblo::test {
namespace {

using nlohmann::json;
using testing::HasSubstr;

/// The summaries that a played session's report has, without what differs by the time, the device's state and
/// repeats, which no sink has.
json figuresOf(const std::string& report) {
    json figures = json::array();
    const json parsed = json::parse(report);
    for (const json& summary : parsed["summaries"]) {
        json kept = json::object();
        for (const auto& [key, value] : summary["payload"].items()) {
            const bool isOfTheMoment = key.starts_with("load_avg") || key.starts_with("num_") ||
                                       key.find("memory") != key.npos || key.find("footprint") != key.npos ||
                                       key == "zrreporting_timestamp" || key == "clientProcessName";
            if (!isOfTheMoment) {
                kept[key] = value;
            }
        }
        figures.push_back({{"event", summary["event"]}, {"payload", kept}});
    }
    return figures;
}

/// Whether both say the same; numbers as far as times allow that were taken twice.
bool agree(const json& one, const json& other) {
    if (one.is_number() && other.is_number()) {
        return std::abs(one.get<double>() - other.get<double>()) <= 0.02;
    }
    if (!one.is_structured() || one.type() != other.type() || one.size() != other.size()) {
        return one == other;
    }
    const auto& items = one.items();
    return std::all_of(items.begin(), items.end(), [&other](const auto& item) {
        return other.is_array() ? agree(item.value(), other[std::stoul(item.key())])
                                : other.contains(item.key()) && agree(item.value(), other[item.key()]);
    });
}

TEST(Record, WhatIsPlayedFromARecordingDerivesTheSameSummaries) {
    const std::string playing = "session --json --fast --reporter ";
    ServiceProcess service({.isInternalBuild = true});
    const std::string recording = service.logs().string() + "/recording";
    for (const auto& [file, type] : {std::pair("music", "longformaudio"), {"call", "telephony"}}) {
        const CommandResult original =
            service.tambloctl(playing + "101 --service-type " + type +
                              R"( --configuration '{"HostApplicationDisplayID":"app"}')" +
                              " --play " EXAMPLES_DIR "/" + file + ".jsonl");
        ASSERT_EQ(original.status, 0) << original.output;
        ASSERT_TRUE(eventually([&service] {
            const auto lines = linesOf(service.logs() / "call-quality.jsonl");
            return !lines.empty() && lines.back().find(R"("op":"flush")") != std::string::npos;
        }));
        const CommandResult recorded = service.tambloctl("record --app app -o " + recording);
        EXPECT_EQ(recorded.status, 0) << recorded.output;
        EXPECT_THAT(recorded.output, HasSubstr(std::string(" of reporter 101, ") + type));
        EXPECT_THAT(recorded.output, HasSubstr("left out as playing makes them anew (summaries)"));
        const CommandResult again = service.tambloctl(playing + "102 --play " + recording);
        ASSERT_EQ(again.status, 0) << again.output;
        EXPECT_FALSE(figuresOf(original.output).empty());
        EXPECT_PRED2(agree, figuresOf(original.output), figuresOf(again.output)) << file;
    }
    EXPECT_EQ(service.tambloctl("record --reporter 9").status, 1);
    EXPECT_EQ(service.tambloctl("record -o /dev/full").status, 1);
}

TEST(Record, ALiveRecordingIsTheSessionUntilItStops) {
    ServiceProcess service({.isInternalBuild = true});
    const std::string live = service.logs().string() + "/live";
    const std::string said = service.logs().string() + "/said";
    auto recorded = std::async(std::launch::async, [&] {
        return run("(" + service.tambloctlCommand("record --live -r 101 -o " + live + " 2>" + said + ")"));
    });
    ASSERT_TRUE(eventually([&] { return contentOf(said).find("recording") != std::string::npos; }));
    const std::string playing = "session --json --fast --reporter ";
    const CommandResult second = service.tambloctl("record --live -r 102 -o " + live);
    EXPECT_EQ(second.status, 1) << "one is made already, and its file stays";
    EXPECT_THAT(second.output, HasSubstr("one at a time"));
    const CommandResult original = service.tambloctl(
        playing +
        "101 --service-type longformaudio --configuration '{\"HostApplicationDisplayID\":\"app\"}'" +
        " --play " EXAMPLES_DIR "/music.jsonl");
    ASSERT_EQ(original.status, 0) << original.output;
    EXPECT_EQ(recorded.get().status, 0) << contentOf(said);
    EXPECT_THAT(linesOf(live).at(0), HasSubstr(R"("configuration":{"HostApplicationDisplayID":"app"})"));
    const CommandResult again = service.tambloctl(playing + "102 --play " + live);
    ASSERT_EQ(again.status, 0) << again.output;
    EXPECT_FALSE(figuresOf(original.output).empty());
    EXPECT_EQ(figuresOf(original.output), figuresOf(again.output));
}

TEST(Record, ALiveRecordingSaysWhatIsMissing) {
    const TemporaryDirectory directory;
    const FileDescriptor listener(boundSocket(SOCK_STREAM, directory.path("status")));
    ASSERT_EQ(::listen(listener.get(), 3), 0);
    // A tap, and three requests for the session, of which nobody knows: so its stop was among what is left
    // out.
    std::thread service([&listener] {
        const std::string line = R"({"time":5,"reporter":7,"service":"haptics","started":true,"type":2,)";
        const std::string shown = line + R"("origin":"message","category":4,"payload":{"a":1}})" + "\n" +
                                  line + R"("origin":"message","category":4,"payload_left_out":70000})" +
                                  "\n" + "{\"left_out\":12}\n";
        std::vector<FileDescriptor> clients;
        for (const std::string& answer :
             {shown, std::string("{}\n"), std::string("{}\n"), std::string("{}\n")}) {
            const FileDescriptor& client = clients.emplace_back(::accept(listener.get(), nullptr, nullptr));
            (void)::send(client.get(), answer.data(), answer.size(), MSG_NOSIGNAL);
            std::array<char, 256> request;
            (void)::recv(client.get(), request.data(), request.size(), 0);
            if (answer != shown) {
                (void)::shutdown(client.get(), SHUT_WR);
            }
        }
    });
    const CommandResult recorded =
        run("timeout 20 " TAMBLOCTL_PATH " record --live -r 7 --socket " + directory.path("status"));
    service.join();
    EXPECT_EQ(recorded.status, 1);
    EXPECT_THAT(recorded.output, HasSubstr("1 messages of the session of reporter 7, haptics"));
    for (const char* missing : {"had begun before", "configuration could not", "12 messages were left out",
                                "1 messages with large payloads"}) {
        EXPECT_THAT(recorded.output, HasSubstr(missing));
    }
}

} // namespace
} // namespace tamblo::test
