#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <filesystem>
#include <iterator>
#include <map>
#include <set>
#include <sstream>
#include <string>
#include <vector>

// What a real service leaves in the call-quality file.

namespace tamblo::test {
namespace {

using Json = nlohmann::json;
using wire::Method;

/// The lines that are complete.
std::vector<Json> callQualityLines(const ServiceProcess& service) {
    std::vector<Json> lines;
    std::istringstream text(readFile(service.logs() / "call-quality.jsonl"));
    for (std::string line; std::getline(text, line) && !text.eof();) {
        lines.push_back(Json::parse(line));
    }
    return lines;
}

std::string operations(const ServiceProcess& service) {
    std::string text;
    for (const Json& line : callQualityLines(service)) {
        text += line["op"].get<std::string>() + " ";
    }
    return text;
}

TEST(CallQuality, ASessionIsOpenedReportedAndFlushedUnderANameOfItsOwn) {
    ServiceProcess service;
    for (int run = 0; run < 2; ++run) {
        RawClient client(service.socketPath());
        startSession(client, 7, 12);
        client.call(message({{"volume", 3}, {"zrreporting_timestamp", 4e9}}, {7}, 0x0800000E, 65535));
        EXPECT_TRUE(eventually([&] { return operations(service).ends_with("open message "); }))
            << "without anything that follows";
        client.call(message({{"volume", 5}}, {7}, 0x0800000E, 65535));
        client.call(request(Method::stopReportingSessionForID, 7));
        EXPECT_TRUE(eventually([&] { return operations(service).ends_with("flush "); }));
        EXPECT_EQ(service.stop(), 0);
        service.start();
    }
    std::set<std::string> names;
    std::string seen;
    for (Json line : callQualityLines(service)) {
        names.insert(line["session"]);
        EXPECT_GT(line["time"], 1.7e9);
        EXPECT_FALSE(line.value("payload", Json::object()).contains("zrreporting_timestamp"));
        if (line["op"] == "open") {
            EXPECT_FALSE(line["sessionInfo"]["HierarchyToken"].get<std::string>().empty());
            line["sessionInfo"].erase("HierarchyToken");
            seen += line["sessionInfo"].dump() + line["userInfo"].dump();
        } else if (line["op"] == "message") {
            seen += " " + line["category"].dump() + "/" + line["type"].dump() + ":" +
                    line["payload"].value("volume", Json("-")).dump();
        } else {
            seen += " f";
        }
    }
    EXPECT_EQ(names.size(), 2U);
    const std::string once =
        R"({"BatchEvent":false,"ClientType":19,"ClientVersion":2.1,"ContainsRealtimeEvents":true,"SessionID":7})"
        R"({"ClientName":"com.vandra.tamblo","ServiceName":"apiusage_session","ZRReportingSessionID":7})"
        R"( 14/65535:3 14/65535:5 1/11:"-" 65535/65535:"5,3" f)";
    EXPECT_EQ(seen, once + once) << "the summary is in the order of the messages' times";
}

TEST(CallQuality, BackendsAreAPreference) {
    ServiceProcess service;
    const struct {
        const char* preference;
        bool isFound;
        const char* error;
    } cases[] = {
        {R"({"backends": []})", false, ""},
        {R"({"backends": ["a", "b"]})", true, ""},
        {R"({"backends": 5})", false, "backends is no array; no back end is found"},
        {R"({"backends": [5]})", false, "backends holds what is no name; that is ignored"},
        {R"({})", true, ""},
    };
    std::string expected;
    std::int64_t reporter = 10;
    for (const auto& c : cases) {
        writeFile(service.preferenceFile("com.vandra.tamblo.callquality"), c.preference);
        // Two sessions: what is wrong is told once.
        for (int i = 0; i < 2; ++i) {
            RawClient client(service.socketPath());
            startSession(client, ++reporter);
            client.call(message({{"n", 1}}, {reporter}));
            client.call(request(Method::stopReportingSessionForID, reporter));
            expected += c.isFound ? "open message message message flush " : "open ";
            EXPECT_TRUE(eventually([&] { return operations(service) == expected; })) << c.preference;
        }
        const std::string log = service.errorOutput();
        const std::size_t found = log.find(c.error);
        EXPECT_NE(found, std::string::npos);
        EXPECT_TRUE(*c.error == '\0' || log.find(c.error, found + 1) == std::string::npos);
    }
}

TEST(CallQuality, NothingIsLostAtTheEndAndSessionsShareFewThreads) {
    ServiceProcess service({.environment = {{"TAMBLO_LOG", "error"}}});
    RawClient client(service.socketPath());
    constexpr std::size_t kSessions = 2000;
    for (std::size_t i = 0; i < kSessions; ++i) {
        startSession(client, 100 + static_cast<std::int64_t>(i));
    }
    const auto threads =
        std::filesystem::directory_iterator("/proc/" + std::to_string(service.pid()) + "/task");
    EXPECT_LE(std::distance(threads, std::filesystem::directory_iterator()), 20);
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
