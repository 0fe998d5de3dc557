#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <string>
#include <vector>

// The summary files of a real service.

namespace tamblo::test {
namespace {

using Json = nlohmann::json;
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
    ServiceProcess service;
    RawClient client(service.socketPath());
    startSession(client, 7, 11);
    wire::Request configuration = request(Method::setConfiguration, 7);
    configuration.dictionary = {{"HostApplicationDisplayID", "../com.example/player"}};
    client.call(configuration);
    const Dictionary payload{{"level", 0.1F}, {"list", Array{1, 2.0, false}}};
    client.call(message(payload, {7}));
    client.call(message(payload, {7}));
    client.call(message({{"level", 1}}, {7}));
    ASSERT_TRUE(stopSession(client, 7));
    const auto files = reports(service);
    ASSERT_EQ(files.size(), 1U);
    EXPECT_THAT(
        files[0].filename().string(),
        testing::MatchesRegex(R"([0-9]{8}-[0-9]{6}[+-][0-9]{4}-7-\.\._com\.example_player-test\.json)"));
    const Json content = Json::parse(readFile(files[0]), nullptr, false);
    ASSERT_EQ(content.size(), 5U) << readFile(files[0]);
    EXPECT_EQ(content[0]["Setup_Start_1"]["isSessionStarted"], "NO");
    const Json& written = content[1]["Playback_Start_1"];
    EXPECT_EQ(written["isSessionStarted"], "YES");
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

} // namespace
} // namespace tamblo::test
