#include "tests/service/ServiceProcess.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <future>
#include <string>
#include <vector>

// What tambloctl shows of the summaries that a real service derives from a session.

namespace tamblo::test {
namespace {

using Json = nlohmann::json;
using testing::HasSubstr;

std::string commandOf(const ServiceProcess& service, const std::string& logs, const std::string& arguments) {
    return "RUNTIME_DIRECTORY=" + (service.directory() / "run").string() + " LOGS_DIRECTORY=" + logs +
           " " TAMBLOCTL_PATH " session " + arguments;
}

TEST(Summaries, AreShownByTambloctl) {
    ServiceProcess service;
    const std::string logs = service.logs();
    // Four sessions that stop at about the same time.
    std::vector<std::future<CommandResult>> runs;
    for (const char* number : {"1", "2", "3", "4"}) {
        const std::string arguments =
            "--json --fast --recorded-spacing --service-type telephony --play " EXAMPLES_DIR
            "/call.jsonl --reporter " +
            std::string(number) + R"( --configuration '{"HostApplicationDisplayID":"application)" + number +
            R"("}')";
        runs.push_back(std::async(std::launch::async, run, commandOf(service, logs, arguments)));
    }
    for (std::size_t i = 0; i < runs.size(); ++i) {
        const Json report = Json::parse(runs[i].get().output);
        std::string kinds;
        for (const Json& summary : report["summaries"]) {
            kinds += summary["event"].get<std::string>().substr(18, 1);
            EXPECT_EQ(summary["payload"]["HostApplicationDisplayID"], "application" + std::to_string(i + 1));
        }
        EXPECT_EQ(kinds, "VVVVSII");
        EXPECT_FALSE(report.contains("summaries_missing"));
    }
    const auto shown = [&service](const std::string& from, const std::string& arguments) {
        return run(commandOf(service, from, arguments)).output;
    };
    EXPECT_THAT(shown(logs, "--reporter 5"), HasSubstr("\nsession  (com.vandra."));
    EXPECT_EQ(shown(logs, "--reporter 6 --quiet"), "");
    EXPECT_THAT(shown(logs + "/nowhere", "--reporter 7"),
                HasSubstr("no summaries: cannot read " + logs + "/nowhere/analytics-events.jsonl: No such"));
    writeFile(service.preferenceFile("com.vandra.tamblo.analytics"), R"({"events_in_use": []})");
    EXPECT_THAT(shown(logs, "--reporter 8"), HasSubstr("no summaries: none came to "));
}

} // namespace
} // namespace tamblo::test
