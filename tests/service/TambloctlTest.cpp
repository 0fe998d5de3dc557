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
        {"send --category Volume --reporter 7 n=5", 0, "sent"},
        {"send --category Nope", 2, "--category needs"},
        {"tail --event x --event=com.vandra.tamblo.Volume* --key n --key n=5.0 -- analytics-events", 0,
         R"(Z com.vandra.tamblo.Volume.Generic {)"},
        {"tail --summary --event com.vandra.tamblo.Volume* --key n", 0, " 1  in all\n"},
        {"tail --summary --event com.vandra.tamblo.Volume", 0, " 0  in all\n"},
        {"reporters", 0, "7 telephony\n"},
        {"validate 7", 0, "7 telephony\n"},
        {"validate 99", 1, "99 is not a reporter"},
        {"session --reporter 9 --quiet", 0, ""},
        {"notify com.example.news 0x10", 0, ""},
        {"notify a/b", 2, "no notification name"},
        {"preference set d key 5", 0, ""},
        {"preference set d other text", 0, ""},
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
    EXPECT_EQ(contentOf(service.runtimeDirectory() + "/notifications/com.example.news"), "16\n");
    EXPECT_EQ(contentOf(service.preferenceFile("broken")), "{\"a\":");
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
}

TEST(Tambloctl, ShowsTheSummariesOfTheSessionItPlays) {
    ServiceProcess service;
    const CommandResult played = service.tambloctl(
        "session --json --fast --recorded-spacing --service-type telephony --reporter 7 "
        "--configuration '{\"HostApplicationDisplayID\":\"app\"}' --play " EXAMPLES_DIR "/call.jsonl");
    std::string kinds;
    const auto report = nlohmann::json::parse(played.output);
    for (const auto& summary : report["summaries"]) {
        kinds += summary["event"].get<std::string>().substr(18, 1);
        EXPECT_EQ(summary["payload"]["HostApplicationDisplayID"], "app");
    }
    EXPECT_EQ(kinds, "VVVVSII");
    writeFile(service.preferenceFile(kAnalytics), R"({"events_in_use": []})");
    EXPECT_THAT(service.tambloctl("session --reporter 8").output, HasSubstr("no summaries: none came to "));
}

} // namespace
} // namespace tamblo::test
