#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <string>
#include <vector>

#include <sys/resource.h>
#include <sys/stat.h>

// The summary files of a real service.

namespace tamblo::test {
namespace {

using Json = nlohmann::json;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::MatchesRegex;
using wire::Method;

std::vector<std::filesystem::path> reports(const ServiceProcess& service) {
    std::vector<std::filesystem::path> found;
    std::error_code ignored;
    for (const auto& entry :
         std::filesystem::directory_iterator(service.logs() / "DiagnosticLogs/Audio/Reporting", ignored)) {
        found.push_back(entry.path());
    }
    return found;
}

bool stopSession(RawClient& client, std::int64_t reporterID) {
    (void)client.call(request(Method::stopReportingSessionForID, reporterID));
    return client.receive().has_value(); // the held start's reply came first
}

TEST(SummaryJsonFile, OfATestSessionIsThereWhenTheStopIsAnswered) {
    ServiceProcess service({.environment = {}, .beforeExec = [] { ::umask(077); }});
    RawClient client(service.socketPath());
    startSession(client, 7, 11);
    wire::Request configuration = request(Method::setConfiguration, 7);
    configuration.dictionary = {{"HostApplicationDisplayID", "../com.example/player"}};
    client.call(configuration);
    const Dictionary payload{{"level", 0.1F}, {"name", "\xC3\xA9\"\n"}, {"list", Array{1, 2.0, false}}};
    client.call(message(payload, {7}));
    client.call(message(payload, {7}));
    client.call(message({{"level", 1}}, {7}));
    ASSERT_TRUE(stopSession(client, 7));

    const auto files = reports(service);
    ASSERT_EQ(files.size(), 1U);
    EXPECT_THAT(files[0].filename().string(),
                MatchesRegex(R"([0-9]{8}-[0-9]{6}[+-][0-9]{4}-7-\.\._com\.example_player-test\.json)"));
    const auto modeOf = [](const std::filesystem::path& path) {
        return static_cast<unsigned>(std::filesystem::status(path).permissions());
    };
    EXPECT_EQ(modeOf(files[0].parent_path()), 0777U);
    EXPECT_EQ(modeOf(files[0].parent_path().parent_path()), 0777U);
    const Json content = Json::parse(readFile(files[0]), nullptr, false);
    ASSERT_EQ(content.size(), 5U) << readFile(files[0]);
    EXPECT_EQ(content[0]["Setup_Start_1"]["isSessionStarted"], "NO");
    const Json& written = content[1]["Playback_Start_1"];
    EXPECT_EQ(written["isSessionStarted"], "YES");
    EXPECT_EQ(written["name"], "\xC3\xA9\"\n");
    EXPECT_EQ(written["list"], Json::parse("[1, 2.0, false]"));
    EXPECT_EQ(content[2]["Playback_Start_2"]["level"], 1);
    EXPECT_TRUE(content[3].contains("Setup_Stop_1"));
    EXPECT_TRUE(content[4].contains("Session_Generic_Summary_1"));
}

TEST(SummaryJsonFile, OfOtherSessionsOnAnInternalBuildOnly) {
    for (const bool isInternal : {false, true}) {
        ServiceProcess service;
        ASSERT_EQ(service.stop(), 0);
        writeFile(service.directory() / "config/device-properties.json",
                  isInternal ? R"({"InternalBuild": true})" : "{}");
        service.start();
        RawClient client(service.socketPath());
        startSession(client, 7, 2);
        ASSERT_TRUE(stopSession(client, 7));
        EXPECT_EQ(reports(service).size(), isInternal ? 1U : 0U);
    }
}

TEST(SummaryJsonFile, AFullDiskIsToldOnceAndDisturbsNobody) {
    ServiceProcess service({.environment = {}, .beforeExec = [] {
                                const rlimit limit{300'000, 300'000};
                                ::setrlimit(RLIMIT_FSIZE, &limit);
                            }});
    writeFile(service.preferenceFile("com.vandra.tamblo.analytics"), R"({"events_in_use": []})");
    RawClient client(service.socketPath());
    startSession(client, 7, 11);
    for (int i = 0; i < 40; ++i) {
        client.call(message({{"n", i}, {"text", std::string(50'000, 'x')}}, {7}));
    }
    ASSERT_TRUE(stopSession(client, 7));
    const std::string log = service.errorOutput();
    const std::string told = "SummaryJsonFileWorker failed to write line. action=writeline file=";
    const std::size_t first = log.find(told);
    ASSERT_NE(first, std::string::npos) << log;
    EXPECT_EQ(log.find(told, first + 1), std::string::npos) << log;
    EXPECT_NE(log.find("error=\"File too large\"", first), std::string::npos) << log;
    EXPECT_TRUE(client.call(message({{"n", 1}}, {7})));
}

} // namespace
} // namespace tamblo::test
