#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gmock/gmock.h>

#include <string>

#include <unistd.h>

// Bug captures, from the socket to the sink's lines and the folder, as an internal build makes them.

namespace tamblo::test {
namespace {

using testing::HasSubstr;
using testing::MatchesRegex;

constexpr const char* kIdentifier = R"([0-9]{8}T[0-9]{6}\.[0-9]{3}Z-[0-9a-f]{8})";

class BugCapture : public testing::Test {
protected:
    BugCapture() : service({.environment = {{"TAMBLO_LOG", "info"}}}) {
        service.stop();
        writeFile(service.directory() / "config" / "device-properties.json", R"({"InternalBuild": true})");
        service.start();
    }
    [[nodiscard]] std::string lines() const { return readFile(service.logs() / "bug-captures.jsonl"); }

    ServiceProcess service;
};

TEST_F(BugCapture, AStuckSystemSoundHasAFolderAndThenALine) {
    RawClient client(service.socketPath());
    startSession(client, 7, 13);
    ASSERT_TRUE(client.call(message({{"System_Sound_Stuck_Time_Seconds", 20}}, {7}, 4, 8)));
    ASSERT_TRUE(eventually([this] { return !lines().empty(); }));
    const std::string request = lines();
    EXPECT_THAT(request,
                MatchesRegex(R"(\{"time":[0-9.]+,"op":"snapshot","session":")" + std::string(kIdentifier) +
                             R"(","signature":\{"domain":"Tonmetry","type":"systemsounds",)"
                             R"("subType":"Playback","subTypeContext":"Joulery",)"
                             R"("detectedProcess":"Unknown"\},"duration":0\.0,"payload":\{.*\}\})"
                             "\n"));

    const std::string session = request.substr(request.find("session\":\"") + 10, 29);
    const auto folder = service.logs() / "captures" / session;
    EXPECT_THAT(readFile(folder / "capture.json"), HasSubstr(session));
    EXPECT_THAT(readFile(folder / "log.txt"), HasSubstr("<6>zrrs "));
    EXPECT_THAT(readFile(folder / "system.txt"), HasSubstr("MemTotal:"));
    EXPECT_THAT(readFile(folder / ("process-" + std::to_string(::getpid()) + ".txt")),
                MatchesRegex("process [0-9]+: .*\n\n== threads\n(.|\n)*== status\n(.|\n)*VmRSS:(.|\n)*"));
}

TEST_F(BugCapture, ALowAlarmIsOnlyKeptWhenTheSessionGoesOn) {
    RawClient client(service.socketPath());
    startSession(client, 7, 4);
    for (int issue = 0; issue < 3; ++issue) {
        EXPECT_EQ(lines(), "");
        ASSERT_TRUE(client.call(message({{"issue_type", "LowRMS"}, {"n", issue}}, {7}, 11, 7)));
    }
    EXPECT_THAT(lines(), HasSubstr(R"("op":"start")"));
    EXPECT_THAT(lines(), HasSubstr(R"("duration":60.0,"payload":{}})"
                                   "\n"));
    EXPECT_EQ(service.stop(), 0);
    EXPECT_THAT(lines(), MatchesRegex(".*\n\\{\"time\":[0-9.]+,\"op\":\"cancel\",\"session\":\"" +
                                      std::string(kIdentifier) + "\"\\}\n"));
}

} // namespace
} // namespace tamblo::test
