#include "tests/service/RawClient.h"
#include "tests/service/ServiceProcess.h"

#include <gmock/gmock.h>

#include <chrono>
#include <string>

// Bug-report drafts and overload captures on an internal build, from the socket to the files.

namespace tamblo::test {
namespace {

using testing::HasSubstr;
using testing::MatchesRegex;

constexpr const char* kDomain = "com.vandra.tamblo.zrreporting";

class DraftsAndOverloads : public testing::Test {
protected:
    void prefer(const std::string& preferences) {
        service.stop();
        writeFile(service.directory() / "config" / "device-properties.json", R"({"InternalBuild": true})");
        writeFile(service.preferenceFile(kDomain), preferences);
        service.start();
    }

    ServiceProcess service{{.environment = {{"TAMBLO_LOG", "info"}}}};
};

TEST_F(DraftsAndOverloads, ADraftIsALineAndItsTimeAPreference) {
    prefer(R"({"TalvixInvalidXyBackOffSeconds": 3600, "other": [1]})");
    RawClient client(service.socketPath());
    startSession(client, 7);
    const auto drafts = service.logs() / "bug-report-drafts.jsonl";
    constexpr double then = 4e9;
    const auto send = [](RawClient& sender, double offset) {
        ASSERT_TRUE(sender.call(
            message({{"tvac_invalid_x", offset}, {"zrreporting_timestamp", then + offset}}, {7}, 14, 11)));
    };
    send(client, 0.0);
    send(client, 5.0);
    EXPECT_EQ(readFile(drafts), "");
    send(client, 5.1);
    const std::string line = readFile(drafts);
    EXPECT_THAT(
        line,
        MatchesRegex(
            R"(\{"time":[0-9]{10}\.[0-9]+,"process":"tamblo_service_","reason":"a Talvix spatial )"
            R"(positioning error occurred","draft":\{"title":"Invalid x/y coordinates during a Talvix )"
            R"(call .QLT.","problemDescription":"Invalid coordinates were provided to the audio layer during a Talvix )"
            R"(call, making it impossible to render spatial audio correctly. Filing this tiklet will )"
            R"(help determine what went wrong.","component":)"
            R"(\{"name":"[^"]+","version":"All","identifier":[0-9]+\},"reproducibility":6,)"
            R"("classification":7,"diagnosticExtensions":\["[^"]+"\]\}\})"
            "\n"));
    EXPECT_TRUE(service.awaitErrorOutput("Successfully created draft"));
    EXPECT_THAT(readFile(service.preferenceFile(kDomain)),
                MatchesRegex(R"(\{"TalvixInvalidXyBackOffSeconds":3600,"TalvixInvalidXyQLTlastRun":)"
                             R"([0-9]{10}\.[0-9]+,"other":\[1\]\})"
                             "\n"));
    // The period is the device's: another run of the service keeps to it.
    EXPECT_EQ(service.stop(), 0);
    service.start();
    RawClient later(service.socketPath());
    startSession(later, 7);
    send(later, 0.0);
    send(later, 6.0);
    EXPECT_EQ(readFile(drafts), line);
}

TEST_F(DraftsAndOverloads, AnOverloadIsPostedAndItsWaitHoldsUpNoOtherConnection) {
    using std::chrono::steady_clock;
    constexpr std::chrono::seconds wait{2};
    prefer(R"({"enable_stackburst": true, "io_buffer_size": 64, "io_cycle": {}, "wait_time": 2e6})");
    RawClient client(service.socketPath());
    startSession(client, 7);
    const auto posted = service.directory() / "run/notifications/com.vandra.tamblo.dropped-stackburst";
    ASSERT_TRUE(client.call(message({{"smallest_buffer_frame_size", 63}}, {7}, 7, 6)));
    EXPECT_EQ(readFile(posted), "");
    const auto begin = steady_clock::now();
    wire::Request overload = message({{"smallest_buffer_frame_size", 64}}, {7}, 7, 6);
    overload.id = 99;
    ASSERT_TRUE(client.send(overload));
    // What no session has to do with is answered meanwhile.
    RawClient other(service.socketPath());
    ASSERT_TRUE(other.sendItem(std::string_view("\x84\x00\x01\x63xyz\x80", 8)));
    EXPECT_TRUE(other.receive());
    EXPECT_LT(steady_clock::now() - begin, wait);
    ASSERT_TRUE(client.receive());
    EXPECT_GE(steady_clock::now() - begin, wait);
    EXPECT_EQ(readFile(posted), "0\n");
    EXPECT_THAT(service.errorOutput(), HasSubstr("io_cycle: a dictionary in place of a number"));
}

} // namespace
} // namespace tamblo::test
