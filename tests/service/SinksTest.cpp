#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gmock/gmock.h>

#include <string>
#include <vector>

#include <glob.h>
#include <unistd.h>

// From the socket to the files: that each sink's lines come out of the real program, and when. What stands in
// them is tested where they are made.

namespace tamblo::test {
namespace {

using testing::ContainsRegex;

enum class Due { withTheReply, soon, withTheStop, withTheEnd };

struct Lines {
    /// A pattern of paths below the logs.
    std::string files;
    /// What they hold, as a regular expression; empty: nothing.
    std::string content;
};

struct Row {
    const char* about;
    /// 0: no session, so that the messages go to the single-message session.
    std::uint16_t serviceType;
    bool isInternalBuild;
    std::vector<wire::Request> messages;
    Due due;
    std::vector<Lines> expected;
    /// How long the session goes on: what is sampled takes its time.
    useconds_t lasts = 0;
};

std::string contentOfAll(const std::filesystem::path& pattern) {
    glob_t found{};
    std::string content;
    if (::glob(pattern.c_str(), 0, nullptr, &found) == 0) {
        for (std::size_t i = 0; i < found.gl_pathc; ++i) {
            content += contentOf(found.gl_pathv[i]);
        }
    }
    ::globfree(&found);
    return content;
}

bool isThere(const ServiceProcess& service, const Lines& lines) {
    const std::string content = contentOfAll(service.logs() / lines.files);
    return lines.content.empty() ? content.empty() : testing::Matches(ContainsRegex(lines.content))(content);
}

void expect(const Row& row) {
    SCOPED_TRACE(row.about);
    ServiceProcess service(
        {.isInternalBuild = row.isInternalBuild,
         .preferences = {{kCaptures, R"({"enable_stackburst": true, "TalvixInvalidXyBackOffSeconds": 9})"}},
         .environment = {{"TAMBLO_LOG", "info"}}});
    RawClient client(service.socketPath());
    if (row.serviceType != 0) {
        client.startSession(7, row.serviceType);
        wire::Request configuration = request(Method::setConfiguration, 7);
        configuration.dictionary = {{"HostApplicationDisplayID", "../com.example/game"}};
        client.call(configuration);
    }
    const auto expectNothingYet = [&] {
        for (const Lines& lines : row.expected) {
            EXPECT_TRUE(lines.content.empty() || !isThere(service, lines)) << lines.files << " is too early";
        }
    };
    for (wire::Request next : row.messages) {
        expectNothingYet();
        if (row.serviceType == 0) {
            next.reporterIDs.clear();
        }
        ASSERT_TRUE(client.call(next));
    }
    ::usleep(row.lasts);
    if (row.due == Due::withTheStop) {
        expectNothingYet();
        EXPECT_TRUE(client.stopSession());
    } else if (row.due == Due::withTheEnd) {
        expectNothingYet();
        EXPECT_EQ(service.stop(), 0);
    }
    for (const Lines& lines : row.expected) {
        EXPECT_TRUE(row.due == Due::soon ? eventually([&] { return isThere(service, lines); })
                                         : isThere(service, lines))
            << lines.files << "\n"
            << contentOfAll(service.logs() / lines.files) << service.errorOutput();
    }
}

TEST(Sinks, LinesComeOutOfTheService) {
    const std::string time = R"(\{"time":[0-9]{10}\.[0-9]+,)";
    const std::string power = time + R"("subsystem":28,"event":)";
    const std::string client = std::to_string(::getpid());
    const std::string capture = R"("session":"[0-9]{8}T[0-9]{6}\.[0-9]{3}Z-[0-9a-f]{8}")";
    const std::string reports = "DiagnosticLogs/Audio/Reporting/";
    const auto draft = [](double offset) {
        return message({{"tvac_invalid_x", offset}, {"zrreporting_timestamp", 4e9 + offset}}, {7}, 14, 11);
    };
    const auto issue = [](Dictionary payload) { return message(std::move(payload), {7}, 11, 7); };
    const Dictionary level{{"level", 0.1F}, {"list", Array{1, 2.0, false}}};
    for (const Row& row : std::vector<Row>{
             {"power",
              2,
              false,
              {message({{"EngineOnTime", 2.5F},
                        {"EngineState", "EngineOn"},
                        {"Haptic_Active_Hardware_Time_Seconds", 90},
                        {"zrreporting_timestamp", 4e9}},
                       {7}, 4, 8)},
              Due::withTheReply,
              {{"power-events.jsonl",
                "^" + power + R"("Korvell_Haptics_EngineOnDuration","payload":\{"ApplicationName":)" +
                    R"("\.\./com\.example/game","EngineOnDuration":2\.5,"TimestampEnd":4000000000\.0\}\})" +
                    "\n" + power + R"("Korvell_Haptics_ClientStatus".*)" + "\n" + power +
                    R"("LeakedHapticsSessionInfo","payload":\{"Haptic_Active_Hardware_Time_Seconds":90\}\})" +
                    "\n$"}}},
             {"power of no session",
              0,
              false,
              {message({{"EngineOnTime", 1}}, {}, 4, 8)},
              Due::withTheReply,
              {{"power-events.jsonl", R"("payload":\{"EngineOnDuration":1,"TimestampEnd":)"},
               {"../stderr", "failed to get app name for joulery"}}},
             {"metrics",
              2,
              false,
              {issue({{"issue_type", 3},
                      {"node", "n"},
                      {"rtaid_client", "com"},
                      {"any_channel_silence_seconds", 2.9}})},
              Due::withTheReply,
              {{"diagnostics-metrics.jsonl",
                "^" + time + R"("metric":5963779,"record":"EAIaATMiAW4qA2NvbQ=="\})" + "\n$"}}},
             {"metrics of no session",
              0,
              false,
              {issue({{"node", 1}})},
              Due::withTheReply,
              {{"diagnostics-metrics.jsonl", R"("record":"EAAaACIBMSoA"\})"
                                             "\n$"},
               {"../stderr", "Failed to get issue_type for AudioIssueDetected"}}},
             {"drafts",
              2,
              true,
              {draft(0.0), draft(5.0), draft(5.1)},
              Due::withTheReply,
              {{"bug-report-drafts.jsonl",
                "^" + time +
                    R"("process":"tamblo_service_","reason":"a Talvix .*"reproducibility":6,.*\}\})" + "\n$"},
               {"../stderr", "Successfully created draft"}}},
             {"a system sound that is stuck",
              13,
              true,
              {message({{"System_Sound_Stuck_Time_Seconds", 20}}, {7}, 4, 8)},
              Due::soon,
              {{"bug-captures.jsonl", "^" + time + R"("op":"snapshot",)" + capture +
                                          R"(,"signature":\{"domain":"Tonmetry","type":"systemsounds",.*\})" +
                                          "\n$"},
               {"captures/*/capture.json", capture},
               {"captures/*/log.txt", "<6>zrrs "},
               {"captures/*/system.txt", "MemTotal:"},
               {"captures/*/process-" + client + ".txt", "== threads\n.*== status\n.*VmRSS:"}}},
             {"an alarm, and the session that goes on until the end",
              4,
              true,
              {issue({{"issue_type", "LowRMS"}}), issue({{"issue_type", "LowRMS"}, {"n", 1}}),
               issue({{"issue_type", "LowRMS"}, {"n", 2}})},
              Due::withTheReply,
              {{"bug-captures.jsonl", R"("op":"start",.*"duration":60\.0,"payload":\{\}\})"
                                      "\n$"}}},
             {"an alarm that ends with the service",
              4,
              true,
              {issue({{"issue_type", "LowRMS"}}), issue({{"issue_type", "LowRMS"}, {"n", 1}}),
               issue({{"issue_type", "LowRMS"}, {"n", 2}})},
              Due::withTheEnd,
              {{"bug-captures.jsonl", "\n" + time + R"("op":"cancel",)" + capture + "\\}\n$"}}},
             {"memory of the client and of whom the payload names",
              2,
              false,
              {message({{"processIDs", Array{::getppid(), -1}}}, {7}, 4, 19)},
              Due::soon,
              {{"memory-log.jsonl", "^" + time + R"("reporter":7,"processes":\[\{"process":)" + client +
                                        R"(,.*\},\{"process":)" + std::to_string(::getppid()) +
                                        R"(,.*"resident":[0-9]{6,}.*"kernel":\{.*"slab":[0-9]{6,})"}}},
             {"stacks of the clients, and nothing of a small buffer",
              2,
              true,
              {message({{"smallest_buffer_frame_size", 511}}, {7}, 7, 6),
               message({{"smallest_buffer_frame_size", 512}}, {7}, 7, 6)},
              Due::withTheEnd,
              {{"stack-captures.jsonl",
                "^" + time + R"("requester":"com\.vandra\.tamblo",.*"options":\[1,1,0,0,0\],"stacks":\[)" +
                    R"(\{"process":)" + client + R"(,.*"threads":\[\{"thread":)" + client +
                    R"(,.*"samples":\[\{.*"count":[1-5])"}}},
             {"a summary of the session's values",
              2,
              false,
              {message({{"volume", 3}}), message({{"volume", 5}})},
              Due::withTheStop,
              {{"analytics-events.jsonl",
                R"("event":"com\.vandra\.telephony\.Session_Generic\.Summary",.*"num_messages":2,)"},
               {reports + "*.json", ""}}},
             {"a file of a session for tests",
              11,
              false,
              {message(level), message(level), message({{"level", 1}})},
              Due::withTheStop,
              {{reports + "[0-9]*-[0-9]*-7-.._com.example_game-test.json",
                R"(Setup_Start_1.*Playback_Start_2.*Session_Generic_Summary_1)"}}},
             {"samples of the processes, of a session that ends with the service",
              2,
              true,
              {message({{"session_output_running", true}})},
              Due::withTheEnd,
              {{"DiagnosticLogs/Audio/Performance/*.json",
                R"("name":"session","pid":)" + client + R"(.*"name":"output","pid":)" + client + ","},
               {"DiagnosticLogs/Audio/Performance/*.json", R"("name":"memory .bytes.","pid":)" + client},
               {"DiagnosticLogs/Audio/Performance/*.json", R"("name":"processor time .% of a core.",)"}},
              350'000},
             {"a file of any session",
              2,
              true,
              {message({{"n", 1}})},
              Due::withTheStop,
              {{reports + "*.json", "\"Playback_Start_1\""}}},
         }) {
        expect(row);
    }
}

TEST(Sinks, ASessionIsToldWhatItsTimeHasAddedToTheDrivers) {
    ServiceProcess service;
    const std::filesystem::path directory = service.runtimeDirectory() + "/chanlog";
    writeFile(directory / "broken.json", R"([{"driver": "HapticEngine", "gro)");
    const auto publish = [&directory](int count) {
        const std::string n = std::to_string(count);
        const std::string names =
            R"("driver": "Haptic_Engine<0>", "group": "Haptics", "subgroup": "Stats", )";
        writeFile(directory / "haptics.json.new",
                  "[{" + names + R"("name": "buffers played", "format": "simple", "value": )" + n + "}, {" +
                      names + R"("name": "state", "format": "state", "states": [)" +
                      R"({"name": "idle", "transitions": 1, "residency": )" + n + R"(},)" +
                      R"({"name": "running", "transitions": 1, "residency": 7}]}, {)" + names +
                      R"("name": "wake_up", "unit": "us", "format": "histogram", "min": 12, "max": 381,)" +
                      R"("buckets": [{"lower": 0, "upper": 100, "hits": )" + n + "}]}]");
        std::filesystem::rename(directory / "haptics.json.new", directory / "haptics.json");
    };
    publish(10);
    for (const int later : {10, 15, 2}) { // nothing, something, a driver that begins anew
        RawClient client(service.socketPath());
        client.startSession();
        publish(later);
        EXPECT_TRUE(client.stopSession());
    }
    for (const char* told : {R"("HapticEngine_Haptics_Stats_Simple_buffersplayed":5,)",
                             R"("HapticEngine_Haptics_Stats_Histogram_wakeup":)"
                             R"("count=1,lower=0,upper=100,min=12,max=381,unit=us::0-100:5",)",
                             R"("HapticEngine_Haptics_Stats_State_state":)"
                             R"("name:idle,transition:0,residency:5,duty_cycle:1.000000;",)"}) {
        EXPECT_EQ(service.countEvents(told), 2U) << told;
    }
    EXPECT_EQ(service.countEvents("HapticEngine"), 6U) << "and nothing else";
    for (const char* line :
         {"broken.json: line 1, column ", "Haptic_Engine<0>/Haptics/Stats/state: a counter has run backwards",
          "Haptic_Engine<0>/Haptics/Stats/wake_up: a counter has run backwards"}) {
        EXPECT_EQ(countOf(line, service.errorOutput()), 1U) << line;
    }
}

} // namespace
} // namespace tamblo::test
