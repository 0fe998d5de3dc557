#include "tests/service/RealService.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <map>

// From the socket to the files: that each sink's lines come out of the real program, and when. What stands in
// them is tested where they are made.

namespace tamblo::test {
namespace {

using namespace testing;

constexpr const char* kCallQuality = "com.vandra.tamblo.callquality";

enum class Due { withTheReply, soon, withTheStop, withTheEnd };

struct Lines {
    std::string files;   ///< a pattern of paths below the logs
    std::string content; ///< what they hold, as a regular expression
};
constexpr const char* kNothing = "^$";

/// For reporter 7.
wire::Request messageOf(std::uint32_t category, std::uint16_t type, Dictionary payload) {
    return message(std::move(payload), {7}, category, type);
}

/// The initials of the operations in the call-quality file, by session.
std::map<std::string, std::string> callQualityOf(const ServiceProcess& service) {
    std::map<std::string, std::string> operations;
    for (const std::string& text : linesOf(service.logs() / "call-quality.jsonl")) {
        const auto line = nlohmann::json::parse(text);
        operations[line["session"]] += line["op"].get<std::string>().front();
    }
    return operations;
}

class Sinks : public Test {
protected:
    /// That these lines come of the messages, no earlier than they are due.
    static void expect(const std::string& build, std::uint16_t serviceType,
                       const std::vector<wire::Request>& messages, Due due,
                       const std::vector<Lines>& expected) {
        ServiceProcess service(
            {.isInternalBuild = build == "internal",
             .preferences = {{kCaptures,
                              R"({"enable_stackburst": true, "TalvixInvalidXyBackOffSeconds": 9})"}},
             .environment = {{"TAMBLO_LOG", "info"}}});
        Session client(service.socketPath(), 7, serviceType);
        client.call({.method = Method::setConfiguration,
                     .reporterID = 7,
                     .dictionary = {{"HostApplicationDisplayID", "../com.example/game"}}});
        const auto contentIn = [&](const Lines& lines) {
            return run("cat " + (service.logs() / lines.files).string() + " 2> /dev/null; true").output;
        };
        const auto areThere = [&](const Lines& lines) {
            return Matches(ContainsRegex(lines.content))(contentIn(lines));
        };
        const auto isEarly = [&](const Lines& lines) { return lines.content != kNothing && areThere(lines); };
        for (const wire::Request& each : messages) {
            EXPECT_TRUE(std::ranges::none_of(expected, isEarly));
            ASSERT_TRUE(client.call(each));
        }
        if (due >= Due::withTheStop) {
            EXPECT_TRUE(std::ranges::none_of(expected, isEarly));
            ::usleep(due == Due::withTheEnd ? 350'000 : 0); // for samples of what the processes do
            EXPECT_TRUE(due == Due::withTheStop ? client.stop() : service.stop() == 0);
        }
        for (const Lines& lines : expected) {
            EXPECT_TRUE(due == Due::soon ? eventually([&] { return areThere(lines); }) : areThere(lines))
                << lines.files << "\n"
                << contentIn(lines) << service.errorOutput();
        }
    }

    const std::string time = R"(\{"time":[0-9]{10}\.[0-9]+,)";
    const std::string me = std::to_string(::getpid());
    const std::string reports = "DiagnosticLogs/Audio/Reporting/*.json";
    const std::string traces = "DiagnosticLogs/Audio/Performance/*.json";
};

TEST_F(Sinks, LinesStandInTheFilesWhenTheReplyIsThere) {
    expect("", 2,
           {messageOf(4, 8,
                      {{"EngineOnTime", 2.5},
                       {"EngineState", "EngineOn"},
                       {"zrreporting_timestamp", 4e9},
                       {"Haptic_Active_Hardware_Time_Seconds", 90}})},
           Due::withTheReply,
           {{"power-events.jsonl",
             "^" + time + R"("subsystem":28,"event":"Korvell_Haptics_EngineOnDuration","payload":)" +
                 R"(\{"ApplicationName":"\.\./com\.example/game","EngineOnDuration":2\.5,)" +
                 R"("TimestampEnd":4000000000\.0\}\})" + "\n.*ClientStatus.*\n.*LeakedHaptics.*\n$"}});
    expect("", 2,
           {messageOf(4, 7,
                      {{"issue_type", 3},
                       {"node", "n"},
                       {"rtaid_client", "com"},
                       {"any_channel_silence_seconds", 2.9}})},
           Due::withTheReply,
           {{"diagnostics-metrics.jsonl",
             "^" + time + R"("metric":5963779,"record":"EAIaATMiAW4qA2NvbQ=="\})" + "\n$"}});
    expect("internal", 2,
           {messageOf(14, 11, {{"tvac_invalid_x", 0}, {"zrreporting_timestamp", 4000000000.0}}),
            messageOf(14, 11, {{"tvac_invalid_x", 6}, {"zrreporting_timestamp", 4000000005.1}})},
           Due::withTheReply,
           {{"bug-report-drafts.jsonl", "^" + time + R"("process":"tamblo_service_","reason":"a Talvix .*)" +
                                            R"("reproducibility":6,.*\}\})" + "\n$"}});
}

TEST_F(Sinks, CapturesFollowAsSoonAsTheyAreGathered) {
    const std::string name = R"("session":"[0-9]{8}T[0-9]{6}\.[0-9]{3}Z-[0-9a-f]{8}")";
    expect("internal", 13, {messageOf(4, 8, {{"System_Sound_Stuck_Time_Seconds", 20}})}, Due::soon,
           {{"bug-captures.jsonl", "^" + time + R"("op":"snapshot",)" + name +
                                       R"(,"signature":\{"domain":"Tonmetry","type":"systemsounds",.*\})" +
                                       "\n$"},
            {"captures/*/capture.json", name},
            {"captures/*/log.txt", "<6>zrrs "},
            {"captures/*/system.txt", "MemTotal:"},
            {"captures/*/process-" + me + ".txt", "== threads\n.*== status\n.*VmRSS:"}});
    const std::string parent = std::to_string(::getppid());
    expect("", 2, {messageOf(4, 19, {{"processIDs", Array{::getppid(), -1}}})}, Due::soon,
           {{"memory-log.jsonl", "^" + time + R"("reporter":7,"processes":\[\{"process":)" + me +
                                     R"(,.*\},\{"process":)" + parent +
                                     R"(,.*"resident":[0-9]{6,}.*"kernel":\{.*"slab":[0-9]{6,})"}});
    expect("internal", 2, {messageOf(7, 6, {{"smallest_buffer_frame_size", 512}})}, Due::withTheEnd,
           {{"stack-captures.jsonl",
             "^" + time + R"("requester":"com\.vandra\.tamblo",.*"options":\[1,1,0,0,0\],"stacks":\[)" +
                 R"(\{"process":)" + me + R"(,.*"threads":\[\{"thread":)" + me +
                 R"(,.*"samples":\[\{.*"count":[1-5])"}});
}

TEST_F(Sinks, CallQualityIsWrittenByAQueueOfItsOwn) {
    const auto line = [this](const std::string& operation, const std::string& rest) {
        return time + "\"op\":\"" + operation + R"(","session":"[0-9a-f]{16}\.1")" + rest + "\\}\n";
    };
    const std::string opened =
        "^" + line("open", R"(,"sessionInfo":\{"BatchEvent":false,"ClientType":19,"ClientVersion":2\.1,)"
                           R"("ContainsRealtimeEvents":true,"HierarchyToken":"[^"]+","SessionID":7\},)"
                           R"("userInfo":\{"ClientName":"com\.vandra\.tamblo",.*)"
                           R"("ServiceName":"apiusage_session","ZRReportingSessionID":7\})");
    expect("", 12, {messageOf(14, 65535, {{"volume", 3}})}, Due::soon,
           {{"call-quality.jsonl",
             opened + line("message", R"(,"category":14,"type":65535,"payload":\{.*"volume":3\})") + "$"}});
    // Held back, though not until the session ends.
    expect("", 2, {messageOf(14, 65535, {{"volume", 3}})}, Due::soon,
           {{"call-quality.jsonl", R"("BatchEvent":true.*)" + line("message", ".*\"volume\":3\\}") + "$"}});
}

TEST_F(Sinks, WithoutABackEndOfCallQualityThereIsNothingToSend) {
    for (const auto& [backends, operations] : {std::pair("[]", "o"), {"5", "ommf"}, {"{}", "ommf"}}) {
        ServiceProcess service(
            {.preferences = {{kCallQuality, R"({"backends": )" + std::string(backends) + "}"}}});
        EXPECT_TRUE(Session(service.socketPath()).stop());
        EXPECT_EQ(service.stop(), 0);
        EXPECT_THAT(callQualityOf(service), ElementsAre(Pair(_, operations))) << backends;
        EXPECT_EQ(countOf("backends is no array; \"spool\"", service.errorOutput()),
                  *backends == '[' ? 0U : 1U);
    }
}

TEST_F(Sinks, OfManySessionsNothingIsLostAtTheEndAndTheyShareFewThreads) {
    ServiceProcess service({.preferences = {{kCallQuality, R"({"backends": ["a", "b"]})"}},
                            .environment = {{"TAMBLO_LOG", "error"}}});
    constexpr std::size_t kSessions = 300;
    Session client(service.socketPath(), kSessions);
    for (std::size_t i = 1; i < kSessions; ++i) {
        client.start(static_cast<std::int64_t>(i));
    }
    EXPECT_LE(entriesOf("/proc/" + std::to_string(service.pid()) + "/task"), 20);
    // To every session; then the end, at once.
    client.call(message({{"n", 1}}, {}));
    client.call(message({{"n", 2}}, {}));
    EXPECT_EQ(service.stop(), 0);
    EXPECT_EQ(callQualityOf(service).size(), kSessions);
    EXPECT_THAT(callQualityOf(service), Each(Pair(_, "ommmmf")));
}

TEST_F(Sinks, WhatASessionLeavesIsThereWhenItsStopIsAnswered) {
    const wire::Request playback = messageOf(4, 1, {{"level", 0.5}}), other = messageOf(4, 1, {{"level", 1}});
    expect("", 2, {playback, other}, Due::withTheStop,
           {{"analytics-events.jsonl",
             R"("event":"com\.vandra\.telephony\.Session_Generic\.Summary",.*"num_messages":2,)"},
            {reports, kNothing},
            {traces, kNothing}});
    expect("", 11, {playback, playback, other}, Due::withTheStop,
           {{"DiagnosticLogs/Audio/Reporting/[0-9]*-[0-9]*-7-.._com.example_game-test.json",
             "Setup_Start_1.*Playback_Start_2.*Session_Generic_Summary_1"}});
    expect("internal", 2, {playback}, Due::withTheStop, {{reports, "\"Playback_Start_1\""}});
    expect("internal", 2, {messageOf(4, 1, {{"session_output_running", true}})}, Due::withTheEnd,
           {{traces, R"("name":"session","pid":)" + me + R"(.*"name":"output","pid":)" + me +
                         R"(,.*"name":"memory .bytes.","pid":)" + me}});
}

TEST_F(Sinks, AFullDiskCostsTheLinesOfItsTimeAndNothingElse) {
    constexpr std::size_t kMessages = 210;
    ServiceProcess service({.environment = {{"TAMBLO_LOG", "error"}}});
    service.limit(RLIMIT_FSIZE, 20'000);
    Session client(service.socketPath());
    for (std::size_t i = 0; i < kMessages; ++i) {
        if (i == kMessages - 10) {
            service.limit(RLIMIT_FSIZE, RLIM_INFINITY);
        }
        const auto reply = client.call(message({{"n", 1000 + i}}));
        ASSERT_TRUE(reply && !reply->error);
    }
    const auto lines = linesOf(service.logs() / "analytics-events.jsonl");
    EXPECT_TRUE(std::ranges::all_of(lines, [](auto& line) { return nlohmann::json::accept(line); }));
    EXPECT_THAT(lines.back(), HasSubstr("\"n\":1209"));
    const std::string lost = std::to_string(2 * kMessages - service.countEvents("\"n\":1"));
    for (const std::string& line :
         {std::string("cannot write: "), "it can be written again; " + lost + " records were lost\n"}) {
        EXPECT_EQ(countOf("analytics-events.jsonl: " + line, service.errorOutput()), 1U) << line;
    }
}

TEST_F(Sinks, ASessionIsToldWhatItsTimeHasAddedToTheDrivers) {
    ServiceProcess service;
    const auto publish = [&](const std::string& count) {
        writeFile(service.runtimeDirectory() + "/chanlog/haptics.json",
                  R"([{"driver": "Haptic_Engine<0>", "group": "Haptics", "subgroup": "Stats", )"
                  R"("name": "buffers played", "format": "simple", "value": )" +
                      count + "}]");
    };
    publish("10");
    Session client(service.socketPath());
    publish("15");
    EXPECT_TRUE(client.stop());
    EXPECT_EQ(service.countEvents(R"("HapticEngine_Haptics_Stats_Simple_buffersplayed":5,)"), 2U);
}

} // namespace
} // namespace tamblo::test
