#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gmock/gmock.h>

#include <string>

// Haptics usage and detected issues, from the socket to the files of their sinks.

namespace tamblo::test {
namespace {

using testing::HasSubstr;
using testing::MatchesRegex;
using wire::Method;

TEST(PowerAndMetrics, LinesStandInTheFilesWhenTheReplyIsThere) {
    ServiceProcess service;
    RawClient client(service.socketPath());
    client.call(request(Method::createReportingSession, 7));
    wire::Request configuration = request(Method::setConfiguration, 7);
    configuration.dictionary = {{"HostApplicationDisplayID", "com.example.game"}};
    client.call(configuration);

    constexpr std::uint32_t category = 4;
    ASSERT_TRUE(client.call(message({{"EngineOnTime", 2.5F},
                                     {"EngineState", "EngineOn"},
                                     {"Haptic_Active_Hardware_Time_Seconds", 90},
                                     {"zrreporting_timestamp", 4e9}},
                                    {7}, category, 8)));
    constexpr const char* time = R"(\{"time":[0-9]{10}\.[0-9]+,"subsystem":28,"event":)";
    EXPECT_THAT(
        readFile(service.logs() / "power-events.jsonl"),
        MatchesRegex(
            std::string(time) +
            R"("Korvell_Haptics_EngineOnDuration","payload":\{"ApplicationName":"com\.example\.game",)"
            R"("EngineOnDuration":2\.5,"TimestampEnd":4000000000\.0\}\})"
            "\n" +
            time +
            R"("Korvell_Haptics_ClientStatus","payload":\{"ApplicationName":"com\.example\.game",)"
            R"("Status":1,"TimestampEnd":4000000000\.0\}\})"
            "\n" +
            time +
            R"("LeakedHapticsSessionInfo","payload":\{"Haptic_Active_Hardware_Time_Seconds":90\}\})"
            "\n"));

    ASSERT_TRUE(client.call(message(
        {{"issue_type", 3}, {"node", "n"}, {"rtaid_client", "com"}, {"any_channel_silence_seconds", 2.9}},
        {7}, category, 7)));
    const auto metrics = service.logs() / "diagnostics-metrics.jsonl";
    EXPECT_THAT(
        readFile(metrics),
        MatchesRegex(R"(\{"time":[0-9]{10}\.[0-9]+,"metric":5963779,"record":"EAIaATMiAW4qA2NvbQ=="\})"
                     "\n"));

    // The single-message session's go there, too.
    ASSERT_TRUE(client.call(message({{"node", 1}}, {}, category, 7)));
    ASSERT_TRUE(client.call(message({{"EngineOnTime", 1}}, {}, category, 8)));
    EXPECT_THAT(readFile(metrics), HasSubstr(R"("record":"EAAaACIBMSoA"})"
                                             "\n"));
    EXPECT_THAT(readFile(service.logs() / "power-events.jsonl"),
                HasSubstr(R"("payload":{"EngineOnDuration":1,"TimestampEnd":)"));
    EXPECT_THAT(service.errorOutput(), HasSubstr("Failed to get issue_type for AudioIssueDetected"));
    EXPECT_THAT(service.errorOutput(), HasSubstr("failed to get app name for joulery"));

    const CommandResult shown = run(TAMBLOCTL_PATH " decode --file " + metrics.string());
    EXPECT_EQ(shown.status, 0);
    EXPECT_THAT(shown.output, HasSubstr("Z 5963779\n  metric: 5963779\n"));
    EXPECT_THAT(shown.output, HasSubstr("AudioIssueDetected {\n  duration: 2\n  issuetype: \"3\"\n"));
}

TEST(PowerAndMetrics, TambloctlDecodesWhatItIsGivenOrExitsWithTwo) {
    const struct {
        const char* input; ///< a command
        const char* arguments;
        int status;
        const char* output;
    } cases[] = {
        {":", "EAIaATMiAW4qA2NvbQ==", 0, "  issuetype: \"3\""},
        {"echo EAIaATMiAW4qA2NvbQ==", "", 0, "  issuetype: \"3\""},
        {":", "'05000000 84 01 03 f6 f5'", 0, R"({"frame":"reply","id":3,"error":null,"result":true})"},
        {R"(printf '\5\0\0\0\204\1\3\366\365')", "", 0, R"({"frame":"reply","id":3,)"},
        {":", "--kind=line EAIaATMiAW4qA2NvbQ==", 2, "tambloctl: line 1: not usable JSON: "},
        {":", "--kind frames x", 2, "\"frames\" is no kind"},
        {":", "'?'", 2, "line 1: not Base64\ntambloctl: it was taken for a record; --kind names another"},
        {":", "", 2, "there is nothing to decode"},
        {":", "a b", 2, "one text or one file"},
        {":", "a --file b", 2, "one text or one file"},
        {":", "--file /nowhere/x", 2, "cannot read /nowhere/x: No such file"},
    };
    for (const auto& row : cases) {
        const std::string command = std::string(row.input) + " | " TAMBLOCTL_PATH " decode " + row.arguments;
        const CommandResult done = run(command + " 2>&1");
        EXPECT_EQ(done.status, row.status) << command;
        EXPECT_THAT(done.output, HasSubstr(row.output)) << command;
    }
}

} // namespace
} // namespace tamblo::test
