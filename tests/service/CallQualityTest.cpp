#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <map>
#include <set>
#include <string>
#include <vector>

// What a real service leaves in the call-quality file, which a queue of its own writes.

namespace tamblo::test {
namespace {

using Json = nlohmann::json;

std::vector<Json> callQualityLines(const ServiceProcess& service) {
    std::vector<Json> lines;
    for (const std::string& line : linesOf(service.logs() / "call-quality.jsonl")) {
        lines.push_back(Json::parse(line));
    }
    return lines;
}

std::string operations(const ServiceProcess& service) {
    std::string text;
    for (const Json& line : callQualityLines(service)) {
        text += line["op"].get<std::string>().substr(0, 1);
    }
    return text;
}

TEST(CallQuality, ASessionIsOpenedReportedAndFlushedUnderANameOfItsOwn) {
    ServiceProcess service;
    for (const std::string before : {"", "ommmmf"}) {
        RawClient client(service.socketPath());
        client.startSession(7, 12);
        client.call(message({{"volume", 3}, {"zrreporting_timestamp", 4e9}}, {7}, 0x0800000E, 65535));
        EXPECT_TRUE(eventually([&] { return operations(service) == before + "om"; }))
            << "without anything that follows";
        client.call(message({{"volume", 5}}, {7}, 0x0800000E, 65535));
        EXPECT_TRUE(client.stopSession());
        EXPECT_TRUE(eventually([&] { return operations(service) == before + "ommmmf"; }));
        EXPECT_EQ(service.stop(), 0);
        service.start();
    }
    std::set<std::string> names;
    std::string seen;
    for (Json line : callQualityLines(service)) {
        names.insert(line["session"]);
        EXPECT_GT(line["time"], 1.7e9);
        const Json payload = line.value("payload", Json::object());
        EXPECT_FALSE(payload.contains("zrreporting_timestamp"));
        if (line["op"] == "open") {
            EXPECT_NE(line["sessionInfo"]["HierarchyToken"], "");
            line["sessionInfo"].erase("HierarchyToken");
            seen += line["sessionInfo"].dump() + line["userInfo"].dump();
        } else if (line["op"] == "message") {
            seen += " " + line["category"].dump() + "/" + line["type"].dump() + ":" +
                    payload.value("volume", Json("-")).dump();
        }
    }
    EXPECT_EQ(names.size(), 2U);
    const std::string once =
        R"({"BatchEvent":false,"ClientType":19,"ClientVersion":2.1,"ContainsRealtimeEvents":true,"SessionID":7})"
        R"({"ClientName":"com.vandra.tamblo","ServiceName":"apiusage_session","ZRReportingSessionID":7})"
        R"( 14/65535:3 14/65535:5 1/11:"-" 65535/65535:"5,3")";
    EXPECT_EQ(seen, once + once) << "the summary is in the order of the messages' times";
}

TEST(CallQuality, BackendsAreAPreference) {
    ServiceProcess service;
    const struct {
        const char* preference;
        const char* operations;
        const char* error;
    } cases[] = {
        {R"({"backends": []})", "o", ""},
        {R"({"backends": ["a", "b"]})", "ommmf", ""},
        {R"({"backends": 5})", "o", "backends is no array; no back end is found"},
        {R"({"backends": [5]})", "o", "backends holds what is no name; that is ignored"},
        {R"({})", "ommmf", ""},
    };
    std::string expected;
    for (const auto& row : cases) {
        writeFile(service.preferenceFile("com.vandra.tamblo.callquality"), row.preference);
        // Two sessions: what is wrong is told once.
        for (const int reporter : {1, 2}) {
            RawClient client(service.socketPath());
            client.startSession(reporter);
            client.call(message({{"n", 1}}, {reporter}));
            EXPECT_TRUE(client.stopSession(reporter));
            expected += row.operations;
            EXPECT_TRUE(eventually([&] { return operations(service) == expected; })) << row.preference;
        }
        if (*row.error != '\0') {
            EXPECT_EQ(countOf(row.error, service.errorOutput()), 1U) << row.error;
        }
    }
}

TEST(CallQuality, NothingIsLostAtTheEndAndSessionsShareFewThreads) {
    ServiceProcess service({.environment = {{"TAMBLO_LOG", "error"}}});
    RawClient client(service.socketPath());
    constexpr std::size_t kSessions = 300;
    for (std::size_t i = 0; i < kSessions; ++i) {
        client.startSession(100 + static_cast<std::int64_t>(i));
    }
    EXPECT_LE(entriesOf("/proc/" + std::to_string(service.pid()) + "/task"), 20);
    // To every session; then the end, at once.
    client.call(message({{"n", 1}}, {}));
    client.call(message({{"n", 2}}, {}));
    EXPECT_EQ(service.stop(), 0);
    std::map<std::string, std::string> bySession;
    for (const Json& line : callQualityLines(service)) {
        bySession[line["session"]] += line["op"].get<std::string>().substr(0, 1);
        if (line.value("category", 0) == 65535) {
            EXPECT_EQ(line["payload"]["n"], "1,2");
        }
    }
    EXPECT_EQ(bySession.size(), kSessions);
    for (const auto& [name, seen] : bySession) {
        EXPECT_EQ(seen, "ommmmf") << name;
    }
}

} // namespace
} // namespace tamblo::test
