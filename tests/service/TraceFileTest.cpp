#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <map>
#include <set>
#include <string>
#include <utility>

#include <unistd.h>

// The performance files of a real service.

namespace tamblo::test {
namespace {

using Json = nlohmann::json;
using wire::Method;

TEST(TraceFile, OfASessionOnAnInternalBuild) {
    ServiceProcess service;
    ASSERT_EQ(service.stop(), 0);
    writeFile(service.directory() / "config/device-properties.json", R"({"InternalBuild": true})");
    service.start();
    const auto directory = service.logs() / "DiagnosticLogs/Audio/Performance";
    RawClient client(service.socketPath());
    startSession(client, 7);
    client.call(message({{"session_output_running", true}}, {7}));
    ::usleep(350'000);
    (void)client.call(request(Method::stopReportingSessionForID, 7));
    // This one stops with the service.
    startSession(client, 8);
    ASSERT_TRUE(eventually([&] { return std::filesystem::exists(directory); }));
    const pid_t servicePid = service.pid();
    ASSERT_EQ(service.stop(), 0);

    std::set<std::string> reporters;
    for (const auto& entry : std::filesystem::directory_iterator(directory)) {
        const Json file = Json::parse(readFile(entry.path()), nullptr, false);
        ASSERT_TRUE(file.is_object()) << entry.path() << readFile(entry.path());
        reporters.insert(file.at("otherData").at("reporterID").dump());
        if (file.at("otherData").at("reporterID") != 7) {
            continue;
        }
        std::map<std::pair<pid_t, std::string>, int> events;
        for (const Json& event : file.at("traceEvents")) {
            ++events[{event.at("pid").get<pid_t>(), event.at("name").get<std::string>()}];
        }
        EXPECT_EQ((events[{::getpid(), "session"}]), 1);
        EXPECT_EQ((events[{::getpid(), "output"}]), 1);
        for (const pid_t pid : {::getpid(), servicePid}) {
            EXPECT_GE((events[{pid, "memory (bytes)"}]), 2);
            EXPECT_GE((events[{pid, "processor time (% of a core)"}]), 1);
        }
    }
    EXPECT_EQ(reporters, (std::set<std::string>{"7", "8"}));
}

} // namespace
} // namespace tamblo::test
