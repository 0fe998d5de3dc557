#include "session/ZRReportingSession.h"
#include "tests/fakes/FakePlatform.h"
#include "workers/ReportFileName.h"
#include "workers/sinks/ZRReportingSessionSummaryJsonFileWorker.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <algorithm>
#include <initializer_list>
#include <limits>
#include <string>
#include <vector>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr const char* kPath = "/reports/20260301-120000+0000-5-Unknown-test.json";

TEST(ReportFileNameTest, TellsLocalTimeAndSession) {
    using std::chrono::seconds;
    const auto at = [](std::int64_t time) { return WallTime(seconds(time)); };
    const std::string longest(206, 'x');
    const struct {
        WallTime time;
        int offset;
        std::int64_t reporter;
        Value application;
        std::string name;
    } cases[] = {
        {at(1'773'476'813), 3600, 7, "com.example.music",
         "20260314-092653+0100-7-com.example.music-test.json"},
        {at(1'773'476'813), -12'600, -7, "a b'\xC3\xA9", "20260314-045653-0330--7-a b'\xC3\xA9-test.json"},
        {at(1'772'323'199), 1, 1, "", "20260301-000000+0000-1--test.json"},
        {at(-1), 0, 1, "a", "19691231-235959+0000-1-a-test.json"},
        {at(951'782'400), 45'900, std::numeric_limits<std::int64_t>::min(), "a",
         "20000229-124500+1245--9223372036854775808-a-test.json"},
        // A name is one part of one file name, whatever a client sends.
        {at(0), 0, 1, "../../etc/x", "19700101-000000+0000-1-.._.._etc_x-test.json"},
        {at(0), 0, 1, std::string("a\0b\n\x1F\x7F", 6), "19700101-000000+0000-1-a_b___-test.json"},
        {at(0), 0, 1, 12.5, "19700101-000000+0000-1-12.5-test.json"},
        {at(0), 0, 1, Array{"a/b"}, "19700101-000000+0000-1-[\"a_b\"]-test.json"},
        {at(0), 0, 1, longest + std::string(17, 'y'),
         "19700101-000000+0000-1-" + longest + std::string(16, 'y') + "-test.json"},
        {at(0), 0, 1, longest + "0123456789ABCDE\xC3\xA9",
         "19700101-000000+0000-1-" + longest + "0123456789ABCDE-test.json"},
    };
    for (const auto& c : cases) {
        const std::string name = reportFileName(c.time, seconds(c.offset), c.reporter, c.application, "test");
        EXPECT_EQ(name, c.name);
        EXPECT_LE(name.size(), 255U);
    }
}

TEST(SummaryJsonFileWorkerMakingTest, OnlyForTestsAndInternalBuilds) {
    for (const bool isInternal : {false, true}) {
        const FakePlatform device(LogLevel::debug, isInternal);
        for (const AudioServiceType type : std::initializer_list<AudioServiceType>{10, 11, 12, 65535}) {
            const auto session = ZRReportingSession::initWithID(5, {1});
            session->setServiceType(type);
            const auto worker = ZRReportingSessionSummaryJsonFileWorker::initWithSession(session);
            ASSERT_EQ(worker != nullptr, isInternal || type == 11) << type;
            EXPECT_TRUE(worker == nullptr || worker->started());
        }
    }
}

class SummaryJsonFileWorkerTest : public testing::Test {
protected:
    SummaryJsonFileWorkerTest() {
        session->setServiceType(AudioServiceTypeTest);
        worker = ZRReportingSessionSummaryJsonFileWorker::initWithSession(session);
        device.log.clear();
    }
    MessageRef send(Dictionary payload, AudioEventCategory category = AudioEventKindVolume,
                    AudioEventType type = AudioEventTypeStart) {
        payload.set("zrreporting_timestamp", device.clock.seconds());
        auto message = std::make_shared<ZRReportingSessionMessage>(std::move(payload), category, type);
        session->sendMessage(message);
        return message;
    }
    /// The worker's lines, as `LEVEL TEXT` with the level as a digit.
    [[nodiscard]] std::vector<std::string> said() {
        std::vector<std::string> said;
        for (const FakeLog::Line& line : device.log.lines()) {
            if (line.prefix.find("SummaryJson") != std::string::npos) {
                EXPECT_EQ(line.category, "zrrr");
                said.push_back(std::to_string(static_cast<int>(line.level)) + " " + line.text);
            }
        }
        device.log.clear();
        return said;
    }
    static std::string line(LogLevel level, const std::string& text) {
        return std::to_string(static_cast<int>(level)) + " " + text;
    }

    FakePlatform device;
    FakeReportFiles& files = device.reportFiles;
    std::shared_ptr<ZRReportingSession> session = ZRReportingSession::initWithID(5, {1});
    std::shared_ptr<ZRReportingSessionWorkerProtocol> worker;

    const std::string opened =
        line(LogLevel::info, std::string("SummaryJsonFileWorker opened file. action=open file=") + kPath);
    const std::string closed =
        line(LogLevel::info, std::string("SummaryJsonFileWorker closed file. action=close file=") + kPath);
};

TEST_F(SummaryJsonFileWorkerTest, WritesOneObjectForEachMessage) {
    send({{"n", 1}})->isRedundant = true;
    const MessageRef first = send({{"n", 2}});
    send({{"n", 3}})->isSessionStarted = true;
    worker->stop();
    const auto object = [](int number, int n, const char* started) {
        return "{\n  \"Volume_Start_" + std::to_string(number) +
               "\": {\n    \"HostApplicationDisplayID\": \"Unknown\",\n    \"audiotag\": \"VolumeStart\",\n"
               "    \"isSessionStarted\": \"" +
               started + "\",\n    \"n\": " + std::to_string(n) +
               ",\n    \"zrreporting_timestamp\": 1772366400.0\n  }\n}\n";
    };
    EXPECT_EQ(files.files[kPath], "[\n" + object(1, 2, "NO") + ",\n" + object(2, 3, "YES") + "]\n");
    EXPECT_EQ(*first->payload().find("isSessionStarted"), Value("NO")) << "later workers see it";
    EXPECT_THAT(files.createdDirectories, ElementsAre("/reports"));
    EXPECT_THAT(said(), ElementsAre(opened, closed));

    // The next file counts anew, under a name of its own time.
    device.clock.advance(std::chrono::seconds(1));
    device.clock.offset = std::chrono::hours(2);
    session->updateConfigurationWithContentsOfConfiguration({{"HostApplicationDisplayID", "a/b"}});
    worker->stop();
    EXPECT_EQ(files.files["/reports/20260301-140001+0200-5-a_b-test.json"], files.files[kPath]);
}

TEST_F(SummaryJsonFileWorkerTest, CountsByNameAndWritesWhatTheSessionRecordedAndDerived) {
    send({{"early", true}});
    session->start();
    // The last two categories have no names of their own. Every second message repeats the first.
    int n = 0;
    for (const AudioEventCategory category : {4U, 0x08000004U, 4U, 99U, 0xFFFFFFFFU}) {
        send({{"n", ++n}}, category, 8);
        send({{"n", n}}, category, 8);
    }
    session->stop();
    const auto content = nlohmann::ordered_json::parse(files.files.at(kPath));
    std::vector<std::string> found;
    for (const auto& object : content) {
        ASSERT_EQ(object.size(), 1U);
        found.push_back(object.begin().key() + " " +
                        object.begin().value().at("isSessionStarted").get<std::string>());
    }
    EXPECT_THAT(found, ElementsAre("Volume_Start_1 NO", "Setup_Start_1 NO", "Playback_Joulery_1 YES",
                                   "Session_Playback_Joulery_1 YES", "Playback_Joulery_2 YES",
                                   "Undefined_Joulery_1 YES", "Undefined_Joulery_2 YES", "Setup_Stop_1 NO",
                                   "Session_Generic_Summary_1 YES"));
}

TEST_F(SummaryJsonFileWorkerTest, WithoutMessagesToWriteThereIsNoFile) {
    worker->stop();
    send({{"n", 1}})->isRedundant = true;
    worker->stop();
    EXPECT_THAT(said(), IsEmpty());
    send({{"n", 2}});
    session.reset();
    worker->stop();
    EXPECT_THAT(files.createdDirectories, IsEmpty());
    EXPECT_THAT(files.files, IsEmpty());
}

TEST_F(SummaryJsonFileWorkerTest, EachFailedStepIsTold) {
    const std::string directory = line(LogLevel::error, "can't create logging directory at /reports: no way");
    const auto failed = [](const std::string& what, const std::string& action) {
        return line(LogLevel::error, "SummaryJsonFileWorker failed to " + what + ". action=" + action +
                                         " file=" + kPath + " error=\"no way\"");
    };
    const struct {
        std::optional<std::string> FakeReportFiles::*failure;
        std::vector<std::string> told;
        bool started;
        bool wrote;
    } cases[] = {
        {&FakeReportFiles::directoryFailure, {directory, opened, closed}, true, true},
        {&FakeReportFiles::openFailure, {failed("open file", "open")}, false, false},
        {&FakeReportFiles::writeFailure, {opened, failed("write line", "writeline"), closed}, true, false},
        // The next file's outage is its own.
        {&FakeReportFiles::writeFailure, {opened, failed("write line", "writeline"), closed}, true, false},
        {&FakeReportFiles::closeFailure, {opened, failed("closed file", "close")}, true, true},
    };
    send({{"n", 1}});
    send({{"n", 2}});
    for (const auto& c : cases) {
        files.files.clear();
        files.*c.failure = "no way";
        worker->setStarted(!c.started);
        worker->stop();
        files.*c.failure = std::nullopt;
        EXPECT_EQ(said(), c.told);
        EXPECT_EQ(worker->started(), c.started) << c.told.back();
        EXPECT_EQ(nlohmann::json::accept(files.files[kPath]), c.wrote) << files.files[kPath];
    }
    worker->stop();
    EXPECT_TRUE(worker->started()) << "opened again";
    EXPECT_THAT(said(), ElementsAre(opened, closed));
}

TEST_F(SummaryJsonFileWorkerTest, WhatHasNoFormLeavesItsSeparator) {
    send({{"n", 1}});
    send({{"deep", Array{Dictionary{{"when", Value::date(1)}}}}});
    const MessageRef bad = send({{"x", std::numeric_limits<double>::infinity()}});
    send({{"n", 4}});
    worker->stop();
    const auto none = [](const std::string& what) {
        return line(LogLevel::error, "dataWithJSONObject: " + what);
    };
    EXPECT_THAT(said(),
                ElementsAre(opened, none("a date has no JSON form, at /Volume_Start_2/deep/0/when"),
                            none("a number that is not finite has no JSON form, at /Volume_Start_3/x"),
                            closed));
    const std::string& content = files.files[kPath];
    EXPECT_NE(content.find("}\n,\n,\n,\n{\n  \"Volume_Start_4\": {"), std::string::npos) << content;
    EXPECT_TRUE(bad->payload().contains("isSessionStarted"));
}

TEST_F(SummaryJsonFileWorkerTest, WritesInPiecesAndTellsOfEachOutageOnce) {
    for (int i = 0; i < 2000; ++i) {
        send({{"n", i}, {"text", std::string(1000, 'x')}});
    }
    worker->stop();
    const std::size_t pieces = files.writes.size();
    EXPECT_GE(pieces, 6U);
    EXPECT_LE(pieces, 40U);
    EXPECT_LE(*std::max_element(files.writes.begin(), files.writes.end()), 512U << 10U);
    EXPECT_EQ(nlohmann::json::parse(files.files[kPath]).size(), 2000U);
    (void)said();

    files.writes.clear();
    files.writeFailure = "disk full";
    files.failingWrites = {2, 3, 5};
    worker->stop();
    const std::string failed = line(
        LogLevel::error, std::string("SummaryJsonFileWorker failed to write line. action=writeline file=") +
                             kPath + " error=\"disk full\"");
    EXPECT_THAT(said(), ElementsAre(opened, failed, failed, closed));
    EXPECT_EQ(files.writes.size(), pieces);
}

} // namespace
} // namespace tamblo
