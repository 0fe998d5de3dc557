#include "tests/service/RealService.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

// The real tambloctl: with a real service, with its files, and without either.

namespace tamblo::test {
namespace {

using testing::HasSubstr;

constexpr const char* kAnalytics = "com.vandra.tamblo.analytics";

TEST(Tambloctl, ExitStatusSaysWhoWasWrong) {
    ServiceProcess service;
    const Session client(service.socketPath());
    writeFile(service.preferenceFile("broken"), "{\"a\":");
    const struct {
        const char* arguments;
        int status;
        const char* output;
    } cases[] = {
        {"send --category Volume --reporter 7 n=5", 0,
         "reporter 7: recorded as com.vandra.tamblo.Volume.Generic, com.vandra.telephony.Volume.Generic\n"},
        {"send -c Volume -r 7 -r 8 n=5", 1, "reporter 8: no client has it"},
        {"send -c Volume -r 8 n=5 -j", 1,
         R"("outcome":"noReporter","reporterID":8,"sessions":0}],"sent":false})"},
        {"send -cVolume n=5 --json", 1, R"("outcome":"unrecorded","sessions":0)"}, // a repeat
        {"send -c Volume zrreporting_timestamp=5 n=6", 0, "recorded in 1 session as "},
        {"send --category Nope", 2, "--category needs"},
        {"send -c Volume --category Error", 2, "given more than once"},
        {"send -c Volume n=null", 2, "takes no null"},
        {"tail --event x --event=com.vandra.tamblo.Volume* --key n --key n=5.0 -- analytics-events", 0,
         R"(Z com.vandra.tamblo.Volume.Generic {)"},
        {"tail --summary --event com.vandra.tamblo.Volume* --key n", 0, " 2  in all\n"},
        {"tail --summary --event com.vandra.tamblo.Volume", 0, " 0  in all\n"},
        {"tail -sS 1h -e com.vandra.tamblo.Volume*", 0, " 2  in all\n"},
        {"tail --summary --until 1h", 0, " 0  in all\n"},
        {"tail --reporter 7 --wide", 0, "  userInfo:\n"},
        {"tail -r 8", 0, ""},
        {"tail analytics-events --reporter 7", 2, "of analytics-events name no reporter"},
        {"tail analytic-events --follow", 2, "is no report sink"},
        {"tail -n3 > /dev/full", 1, ""},
        {"tail -fs", 2, "cannot go together"},
        {"--version", 0, "tambloctl 1."},
        {"kill -h", 0, "usage: tambloctl kill"},
        {"list categories", 0, "\nSession_Playback           134217732   0x08000004\n"},
        {"list service-types --json", 0, R"({"name":"haptics","number":3})"},
        {"list nothing", 2, "log-codes"},
        {"reporters", 0, "7 telephony\n"},
        {"validate 7", 0, "7 telephony\n"},
        {"validate 99", 1, "99 is not a reporter"},
        {"validate 99 --json", 1, R"("reporterID":99,)"},
        {"session --reporter 9 --quiet", 0, ""},
        {"session --reporter 9 --fast", 2, "--fast needs --play"},
        {"session show 7 --fast", 2, "takes no --fast"},
        {"help send receive", 2, "no place behind help"},
        {"session --reporter 9 --play /", 2, "cannot read /: Is a directory"},
        {"notify com.example.news 0x10", 0, ""},
        {"notify a/b", 2, "no notification name"},
        {"preference set d key 5", 0, ""},
        {"preference set d other text", 0, ""},
        {"preference set com.vandra.tamblo.analytics events_in_use text", 2, "is an array of texts"},
        {"preference set com.vandra.tamblo.analytics events [] ", 0, "note: the service reads no"},
        {"preference get d", 0, "{\"key\":5,\"other\":\"text\"}\n"},
        {"preference unset d other", 0, ""},
        {"preference get d key", 0, "5\n"},
        {"preference get broken", 1, "it is left as it is"},
        {"preference set broken a 1", 1, "it is left as it is"},
        {"decode EAIaATMiAW4qA2NvbQ==", 0, "  issuetype: \"3\""},
        {"decode --kind=line EAIaATMiAW4qA2NvbQ==", 2, "tambloctl: line 1: not usable JSON: "},
        {"report --since yesterday", 2, "is no time"},
        {"report a b", 2, "one directory"},
        {"report -o", 2, "needs a value"},
        {"report --app x /nonexistent", 1, "there is no directory /nonexistent"},
        {"report --since 2d -o /dev/null/x", 1, "cannot write /dev/null/x"},
        {"kill", 0, ""},
        {"kill --timeout 0", 3, "no service answers at "},
    };
    for (const auto& row : cases) {
        const CommandResult done = service.tambloctl(row.arguments);
        EXPECT_EQ(done.status, row.status) << row.arguments << "\n" << done.output;
        EXPECT_THAT(done.output, HasSubstr(row.output)) << row.arguments;
    }
    EXPECT_EQ(service.awaitEnd(), 2) << "it was killed";
    EXPECT_EQ(service.countEvents("zrreportingclientuptime"), 0U) << "looking adds nothing";
    EXPECT_EQ(contentOf(service.runtimeDirectory() + "/notifications/com.example.news"), "16\n");
    EXPECT_EQ(contentOf(service.preferenceFile("broken")), "{\"a\":");
}

TEST(Tambloctl, WhatIsForbiddenOrMissingIsSaidToBe) {
    ServiceProcess service;
    const Session client(service.socketPath());
    const auto logs = service.logs() / "analytics-events.jsonl";
    EXPECT_EQ(service.tambloctl("send -c Volume n=1").status, 0);
    const auto forbid = [](const std::filesystem::path& path) {
        std::filesystem::permissions(path, std::filesystem::perms::none);
    };
    // Root is subject to permissions, too, once it may not override them.
    const std::string subject =
        ::geteuid() == 0 ? "setpriv --bounding-set=-dac_override,-dac_read_search env " : "env ";
    const auto expect = [&](const std::string& arguments, int status, const std::string& output) {
        const CommandResult done = run(subject + service.tambloctlCommand(arguments));
        EXPECT_EQ(done.status, status) << arguments;
        EXPECT_THAT(done.output, HasSubstr(output)) << arguments;
    };
    forbid(logs);
    const std::string mode = " with mode 0000";
    expect("tail", 1,
           "cannot read " + logs.string() + ": permission denied; " + logs.string() + " belongs to ");
    expect("send -c Volume n=2", 0, "whether it was recorded cannot be seen: cannot read ");
    forbid(service.logs());
    expect("tail --follow", 1, "permission denied; " + service.logs().string() + " belongs to ");
    expect("record", 1, "permission denied; " + service.logs().string() + " belongs to ");
    forbid(service.runtimeDirectory());
    for (const char* command :
         {"reporters", "kill", "send -c Volume n=3", "status", "tap", "record --live -r 7"}) {
        expect(command, 3, "permission denied; " + service.runtimeDirectory() + " belongs to ");
        expect(command, 3, mode);
    }
    expect("notify name", 1, mode);
    std::filesystem::permissions(service.runtimeDirectory(), std::filesystem::perms::owner_all);
    std::filesystem::permissions(service.logs(), std::filesystem::perms::owner_all);

    for (const char* command : {"reporters", "status"}) {
        EXPECT_THAT(service.tambloctl(command + (" --socket /" + std::string(200, 'a'))).output,
                    HasSubstr("too long for a socket's path"));
    }
    service.stop();
    std::filesystem::remove_all(service.runtimeDirectory());
    EXPECT_EQ(service.tambloctl("notify name").status, 3);
    EXPECT_FALSE(std::filesystem::exists(service.runtimeDirectory()));
}

TEST(Tambloctl, TailGoesOn) {
    ServiceProcess service;
    service.stop();
    const auto file = service.logs() / "power-events.jsonl";
    const auto line = [](int n) {
        return R"({"time":1.5,"subsystem":28,"event":"e","payload":{"n":)" + std::to_string(n) + "}}\n";
    };
    writeFile(file, line(1) + line(2) + line(3));
    const std::string follow =
        service.tambloctlCommand("tail power-events --json --lines 2 --follow --key n");
    std::FILE* const follower = ::popen(follow.c_str(), "r");
    const auto next = [follower](int lines) {
        char text[256] = {};
        std::string read;
        for (int i = 0; i < lines && std::fgets(text, sizeof text, follower) != nullptr; ++i) {
            read += text;
        }
        return read;
    };
    EXPECT_EQ(next(2), line(2) + line(3));
    writeFile(file, line(4), std::ios::app);
    EXPECT_EQ(next(1), line(4));
    EXPECT_EQ(WEXITSTATUS(::pclose(follower)), 0) << "it ends with its reader";
    // Of all files, the oldest first, and with metric records as what they say.
    writeFile(file.string() + ".1", R"({"time":1,"subsystem":28,"event":"old"})"
                                    "\n");
    const std::string all = service.tambloctl("tail power-events --since 1 --until 1.6 --json").output;
    EXPECT_THAT(all, testing::StartsWith(R"({"time":1,"subsystem":28,"event":"old"})"));
    EXPECT_EQ(countOf("\n", all), 5U);
    writeFile(service.logs() / "diagnostics-metrics.jsonl",
              R"({"time":0,"metric":5963779,"record":"EAIaATMiAW4qA2NvbQ=="})"
              "\n");
    EXPECT_THAT(service.tambloctl("tail diagnostics-metrics").output,
                HasSubstr(R"("record":{"duration":2,"issuetype":"3","node":"n","rtaidclient":"com"})"));
}

TEST(Tambloctl, ShowsTheSummariesOfTheSessionItPlays) {
    ServiceProcess service;
    const CommandResult played = service.tambloctl(
        "session --json --fast --service-type telephony --reporter 7 "
        "--configuration '{\"HostApplicationDisplayID\":\"app\"}' --play " EXAMPLES_DIR "/call.jsonl");
    std::string kinds;
    const auto report = nlohmann::json::parse(played.output);
    for (const auto& summary : report["summaries"]) {
        kinds += summary["event"].get<std::string>().substr(18, 1);
        EXPECT_EQ(summary["payload"]["HostApplicationDisplayID"], "app");
    }
    EXPECT_EQ(kinds, "VVVVSII");
    // The same from a pipe, and with timestamps that lie as close together as the messages were sent.
    const std::string fromPipe =
        "session --json --speed 200 --reporter 8 --play - < " EXAMPLES_DIR "/call.jsonl";
    EXPECT_EQ(nlohmann::json::parse(service.tambloctl(fromPipe).output)["summaries"].size(), kinds.size());
    const CommandResult rushed = service.tambloctl(
        "session --json --fast --sending-times --reporter 9 --play " EXAMPLES_DIR "/call.jsonl");
    EXPECT_LT(nlohmann::json::parse(rushed.output)["summaries"].size(), kinds.size());
    writeFile(service.preferenceFile(kAnalytics), R"({"events_in_use": []})");
    EXPECT_THAT(service.tambloctl("session --reporter 8").output, HasSubstr("no summaries: none came to "));
    EXPECT_THAT(service.tambloctl("send -c Volume n=1 -j").output, HasSubstr(R"("outcome":"notInUse")"));
}

} // namespace
} // namespace tamblo::test
