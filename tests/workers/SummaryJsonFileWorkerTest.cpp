#include "base/Format.h"
#include "tests/workers/WorkerTest.h"
#include "workers/ReportFileName.h"
#include "workers/sinks/ZRReportingSessionSummaryJsonFileWorker.h"

#include <nlohmann/json.hpp>

#include <algorithm>
#include <limits>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr const char* kPath = "/reports/20260301-120000+0000-5-Unknown-test.json";

TEST(ReportFileNameTest, TellsLocalTimeAndSession) {
    const std::string longest(206, 'x');
    const std::string epoch = "19700101-000000+0000-1-";
    const struct {
        std::int64_t time;
        int offset;
        std::int64_t reporter;
        Value application;
        std::string name;
    } cases[] = {
        {1'773'476'813, -12'600, -7, "a b'\xC3\xA9", "20260314-045653-0330--7-a b'\xC3\xA9-test.json"},
        {1'772'323'199, 1, 1, "", "20260301-000000+0000-1--test.json"},
        {-1, 0, 1, "a", "19691231-235959+0000-1-a-test.json"},
        {951'782'400, 45'900, INT64_MIN, "a", "20000229-124500+1245--9223372036854775808-a-test.json"},
        // A name is one part of one file name, whatever a client sends.
        {0, 0, 1, std::string("../a\0b\n\x1F\x7F", 9), epoch + ".._a_b___-test.json"},
        {0, 0, 1, Array{"a/b", 12.5}, epoch + "[\"a_b\",12.5]-test.json"},
        {0, 0, 1, longest + std::string(17, 'y'), epoch + longest + std::string(16, 'y') + "-test.json"},
        {0, 0, 1, longest + "0123456789ABCDE\xC3\xA9", epoch + longest + "0123456789ABCDE-test.json"},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(reportFileName(WallTime(std::chrono::seconds(c.time)), std::chrono::seconds(c.offset),
                                 c.reporter, c.application, "test"),
                  c.name);
    }
}

class SummaryJsonFileWorkerTest : public WorkerTest {
protected:
    SummaryJsonFileWorkerTest() {
        session = makeSession(AudioServiceTypeTest);
        worker = tryToMake<ZRReportingSessionSummaryJsonFileWorker>();
        device.log.clear();
    }
    MessageRef sendVolume(Dictionary payload) {
        payload.set("zrreporting_timestamp", device.clock.seconds());
        return send(std::move(payload), AudioEventKindVolume, AudioEventTypeStart);
    }
    FakeReportFiles& files = device.reportFiles;
    std::shared_ptr<ZRReportingSessionSummaryJsonFileWorker> worker;
};

TEST_F(SummaryJsonFileWorkerTest, WritesOneObjectForEachMessage) {
    worker->stop();
    sendVolume({{"n", 1}})->isRedundant = true;
    worker->stop();
    EXPECT_THAT(files.createdDirectories, IsEmpty()) << "without messages to write there is no file";
    const MessageRef first = sendVolume({{"n", 2}});
    sendVolume({{"n", 3}})->isSessionStarted = true;
    worker->stop();
    const auto object = [](const char* name, const char* started, int n) {
        return formatted("{}\n  \"Volume_Start_{}\": {}\n    \"HostApplicationDisplayID\": \"Unknown\",\n"
                         "    \"audiotag\": \"VolumeStart\",\n    \"isSessionStarted\": \"{}\",\n"
                         "    \"n\": {},\n    \"zrreporting_timestamp\": 1772366400.0\n  {}\n{}\n",
                         "{", name, "{", started, n, "}", "}");
    };
    EXPECT_EQ(files.files[kPath], "[\n" + object("1", "NO", 2) + ",\n" + object("2", "YES", 3) + "]\n");
    EXPECT_EQ(*first->payload().find("isSessionStarted"), Value("NO")) << "later workers see it";
    EXPECT_THAT(files.createdDirectories, ElementsAre("/reports"));

    // The next file counts anew, under a name of its own time.
    device.clock.advance(std::chrono::seconds(1));
    device.clock.offset = std::chrono::hours(2);
    worker->stop();
    EXPECT_EQ(files.files["/reports/20260301-140001+0200-5-Unknown-test.json"], files.files[kPath]);
    // Categories without names of their own are counted together.
    for (const AudioEventCategory category : {0x0800000EU, 99U, 0xFFFFFFFFU}) {
        send({{"n", category}}, category, 8);
    }
    files.files.clear();
    worker->stop();
    std::string names;
    for (const auto& written : nlohmann::ordered_json::parse(files.files.begin()->second)) {
        names += written.begin().key() + " ";
    }
    EXPECT_EQ(names, "Volume_Start_1 Volume_Start_2 Session_Volume_Joulery_1 Undefined_Joulery_1 "
                     "Undefined_Joulery_2 ");
    files.files.clear();
    session.reset();
    worker->stop();
    EXPECT_THAT(files.files, IsEmpty());
}

TEST_F(SummaryJsonFileWorkerTest, EachFailedStepIsTold) {
    const struct {
        std::optional<std::string> FakeReportFiles::*failure;
        const char* told;
        bool wrote;
    } cases[] = {
        {&FakeReportFiles::directoryFailure, "eii", true},
        {&FakeReportFiles::openFailure, "e", false},
        {&FakeReportFiles::writeFailure, "iei", false},
        // The next file's outage is its own.
        {&FakeReportFiles::writeFailure, "iei", false},
        {&FakeReportFiles::closeFailure, "ie", true},
    };
    sendVolume({{"n", 1}});
    sendVolume({{"n", 2}});
    for (const auto& c : cases) {
        files.files.clear();
        files.*c.failure = "no way";
        worker->stop();
        files.*c.failure = std::nullopt;
        EXPECT_EQ(loggedLevels(ZRReportingSessionCategory()), c.told);
        EXPECT_EQ(nlohmann::json::accept(files.files[kPath]), c.wrote) << files.files[kPath];
    }
}

TEST_F(SummaryJsonFileWorkerTest, WhatHasNoFormLeavesItsSeparator) {
    sendVolume({{"deep", Array{Dictionary{{"when", Value::date(1)}}}}});
    sendVolume({{"x", std::numeric_limits<double>::infinity()}});
    sendVolume({{"n", 3}});
    worker->stop();
    EXPECT_EQ(loggedLevels(ZRReportingSessionCategory()), "ieei");
    EXPECT_TRUE(files.files[kPath].starts_with("[\n,\n,\n{\n  \"Volume_Start_3\": {")) << files.files[kPath];
}

TEST_F(SummaryJsonFileWorkerTest, WritesInPiecesAndTellsOfEachOutageOnce) {
    for (int i = 0; i < 2000; ++i) {
        sendVolume({{"n", i}, {"text", std::string(1000, 'x')}});
    }
    worker->stop();
    const std::size_t pieces = files.writes.size();
    EXPECT_GE(pieces, 6U);
    EXPECT_LE(pieces, 40U);
    EXPECT_LE(*std::max_element(files.writes.begin(), files.writes.end()), 512U << 10U);
    EXPECT_EQ(nlohmann::json::parse(files.files[kPath]).size(), 2000U);
    files.writes.clear();
    files.writeFailure = "disk full";
    files.failingWrites = {2, 3, 5};
    (void)loggedLevels(ZRReportingSessionCategory());
    worker->stop();
    EXPECT_EQ(loggedLevels(ZRReportingSessionCategory()), "ieei");
    EXPECT_EQ(files.writes.size(), pieces);
}

} // namespace
} // namespace tamblo
