#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <map>
#include <string>

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

    std::map<std::string, int> events;
    for (const auto& entry : std::filesystem::directory_iterator(directory)) {
        const Json file = Json::parse(readFile(entry.path()), nullptr, false);
        ASSERT_TRUE(file.is_object()) << entry.path() << readFile(entry.path());
        const std::string reporter = file.at("otherData").at("reporterID").dump();
        for (const Json& event : file.at("traceEvents")) {
            const bool isService = event.at("pid") == servicePid;
            ++events[reporter + (isService ? " service " : " client ") + event.at("name").get<std::string>()];
        }
    }
    EXPECT_EQ(events["7 client session"], 1);
    EXPECT_EQ(events["7 client output"], 1);
    EXPECT_GE(events["7 client memory (bytes)"], 2);
    EXPECT_GE(events["7 service processor time (% of a core)"], 1);
    EXPECT_EQ(events["8 client session"], 1);
}

} // namespace
} // namespace tamblo::test
