#include "tests/base/AllocationCount.h"
#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"
#include "tools/MetricRecord.h"
#include "util/LogCategories.h"
#include "workers/sinks/ZRReportingSessionJouleryWorker.h"
#include "workers/sinks/ZRReportingSessionQMXWorker.h"

#include <gmock/gmock.h>

#include <cmath>
#include <string>
#include <vector>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::ElementsAreArray;
using testing::IsEmpty;

template <typename Worker> class SinkTest : public testing::Test {
protected:
    FakePlatform device;
    std::shared_ptr<ZRReportingSession> session = ZRReportingSession::initWithID(5, {1});
    std::shared_ptr<Worker> worker = std::make_shared<Worker>(session);
};

class JouleryWorkerTest : public SinkTest<ZRReportingSessionJouleryWorker> {
protected:
    /// `NAME PAYLOAD` of each event.
    [[nodiscard]] std::vector<std::string> events() const {
        std::vector<std::string> texts;
        for (const auto& event : device.powerEvents.events) {
            EXPECT_EQ(event.subsystem, 28U);
            texts.push_back(event.name + " " + jsonText(event.payload));
        }
        return texts;
    }
};

TEST_F(JouleryWorkerTest, EachTriggerIsAnEventAndWhatIsMissingIsLeftOut) {
    constexpr const char* noName = "failed to get app name for joulery";
    constexpr const char* noTime = "failed to get ZRReporting timestamp for joulery";
    const struct {
        Value appName;
        Dictionary payload;
        std::vector<std::string> events;
        std::vector<std::string> errors;
    } cases[] = {
        {"com.a", {{"engineontime", 1}, {"Active_Clients", 2}, {"zrreporting_timestamp", 1.5}}, {}, {}},
        {"com.a",
         {{"EngineOnTime", 2.5F}, {"zrreporting_timestamp", 1.5}},
         {R"(Korvell_Haptics_EngineOnDuration {"ApplicationName":"com.a","EngineOnDuration":2.5,)"
          R"("TimestampEnd":1.5})"},
         {}},
        {"Unknown",
         {{"EngineOnTime", "5 s"}, {"EngineState", "EngineOn"}},
         {R"(Korvell_Haptics_EngineOnDuration {"EngineOnDuration":"5 s"})",
          R"(Korvell_Haptics_ClientStatus {"ApplicationName":"Unknown","Status":1})"},
         {noName, noTime}},
        {"unknown",
         {{"EngineOnTime", 0}},
         {R"(Korvell_Haptics_EngineOnDuration {"ApplicationName":"unknown","EngineOnDuration":0})"},
         {noTime}},
        {"com.a",
         {{"EngineState", "engineOn"}, {"zrreporting_timestamp", "then"}},
         {R"(Korvell_Haptics_ClientStatus {"ApplicationName":"com.a","Status":0,"TimestampEnd":"then"})"},
         {}},
        {7, {{"EngineState", 1}}, {R"(Korvell_Haptics_ClientStatus {"ApplicationName":7,"Status":0})"}, {}},
        {"com.a",
         {{"EngineState", "EngineOn "}},
         {R"(Korvell_Haptics_ClientStatus {"ApplicationName":"com.a","Status":0})"},
         {}},
        {"com.a",
         {{"Haptic_Active_Hardware_Time_Seconds", 90}, {"Active_Clients", Array{"a", "b"}}},
         {R"(LeakedHapticsSessionInfo {"Active_Clients":["a","b"],"Haptic_Active_Hardware_Time_Seconds":90})"},
         {}},
        {"com.a",
         {{"Haptic_Active_Hardware_Time_Seconds", 1}, {"EngineState", "EngineOn"}, {"EngineOnTime", 3}},
         {R"(Korvell_Haptics_EngineOnDuration {"ApplicationName":"com.a","EngineOnDuration":3})",
          R"(Korvell_Haptics_ClientStatus {"ApplicationName":"com.a","Status":1})",
          R"(LeakedHapticsSessionInfo {"Haptic_Active_Hardware_Time_Seconds":1})"},
         {noTime}},
    };
    for (const auto& row : cases) {
        device.powerEvents.events.clear();
        device.log.clear();
        session->updateConfigurationWithContentsOfConfiguration({{"HostApplicationDisplayID", row.appName}});
        device.log.clear();
        worker->handleMessage(messageOf(row.payload, 4, AudioEventTypeJoulery));
        EXPECT_THAT(events(), ElementsAreArray(row.events)) << jsonText(row.payload);
        EXPECT_THAT(device.log.texts(), ElementsAreArray(row.errors)) << jsonText(row.payload);
        for (const FakeLog::Line& line : device.log.lines()) {
            EXPECT_EQ(line.category, ZRReportingJouleryCategory().code());
            EXPECT_EQ(line.level, LogLevel::error);
        }
    }
}

TEST_F(JouleryWorkerTest, WithoutASessionThereIsNoNameAndTheEventsStillCome) {
    session.reset();
    worker->handleMessage(messageOf({{"EngineOnTime", 1}, {"EngineState", ""}}, 4, AudioEventTypeJoulery));
    EXPECT_THAT(events(), ElementsAre(R"(Korvell_Haptics_EngineOnDuration {"EngineOnDuration":1})",
                                      R"(Korvell_Haptics_ClientStatus {"Status":0})"));
}

class QMXWorkerTest : public SinkTest<ZRReportingSessionQMXWorker> {
protected:
    /// Each record as `DURATION ISSUETYPE|NODE|RTAIDCLIENT`.
    [[nodiscard]] std::vector<std::string> records() const {
        std::vector<std::string> texts;
        for (const auto& [metric, bytes] : device.diagnosticsMetrics.records) {
            EXPECT_EQ(metric, 5963779U);
            tools::ProtoReader reader(bytes);
            qmxmetrics::AudioIssueDetected record;
            EXPECT_TRUE(tools::readRecord(reader, record) && reader.atEnd());
            EXPECT_FALSE(record.timestamp);
            texts.push_back(std::to_string(record.duration) + " " + record.issuetype + "|" + record.node +
                            "|" + record.rtaidclient);
        }
        return texts;
    }
};

TEST_F(QMXWorkerTest, EveryDetectionIsARecordOfWhatThereIs) {
    const auto missing = [](const char* key) {
        return "Failed to get " + std::string(key) + " for AudioIssueDetected";
    };
    const std::string type = missing("issue_type");
    const std::string client = missing("rtaid_client");
    const std::string node = missing("node");
    const std::string seconds = missing("any_channel_silence_seconds");
    const struct {
        Dictionary payload;
        std::string record;
        std::vector<std::string> errors;
    } cases[] = {
        {{}, "0 ||", {type, client, node, seconds}},
        {{{"issue_type", 3}, {"any_channel_silence_seconds", 2.9}}, "2 3||", {client, node}},
        {{{"issue_type", "G\xC3\xA4"},
          {"rtaid_client", ""},
          {"node", 0.5F},
          {"any_channel_silence_seconds", -2.9}},
         "-2 G\xC3\xA4|0.5|",
         {}},
        {{{"node", Dictionary{{"b", true}}}, {"rtaid_client", Array{1, "x"}}},
         R"(0 |{"b":true}|[1,"x"])",
         {type, seconds}},
        {{{"node", "n"}, {"any_channel_silence_seconds", 0x1'0000'0007}}, "7 |n|", {type, client}},
        {{{"node", "n"}, {"any_channel_silence_seconds", 0x8000'0000}}, "-2147483648 |n|", {type, client}},
        {{{"node", "n"}, {"any_channel_silence_seconds", " 12.7 s"}}, "12 |n|", {type, client}},
        {{{"node", "n"}, {"any_channel_silence_seconds", std::nan("")}}, "0 |n|", {type, client}},
    };
    for (const auto& row : cases) {
        device.diagnosticsMetrics.records.clear();
        device.log.clear();
        worker->handleMessage(messageOf(row.payload, 0xFFFFFFFF, AudioEventTypeIssueDetector));
        EXPECT_THAT(records(), ElementsAre(row.record));
        EXPECT_THAT(device.log.texts(), ElementsAreArray(row.errors)) << row.record;
        for (const FakeLog::Line& line : device.log.lines()) {
            EXPECT_EQ(line.category, ZRReportingQMXLogCategory().code());
            EXPECT_EQ(line.level, LogLevel::error);
        }
    }
    worker->handleMessage(messageOf({}, 4, AudioEventTypeIssueDetector));
    EXPECT_EQ(device.diagnosticsMetrics.records.back().second,
              (std::vector<std::uint8_t>{0x10, 0, 0x1A, 0, 0x22, 0, 0x2A, 0}));
}

TEST(SinksOfOneType, OtherMessagesCostThemNothing) {
    FakePlatform device;
    const auto session = ZRReportingSession::initWithID(5, {1});
    ZRReportingSessionJouleryWorker joulery(session);
    ZRReportingSessionQMXWorker qmx(session);
    const Dictionary payload{{"EngineOnTime", 1}, {"EngineState", "EngineOn"}, {"issue_type", 1}};
    constexpr AudioEventType types[] = {0, 6, 7, 8, 9, 20, 7 + 256, 8 + 256, 65535};
    for (const AudioEventType type : types) {
        const MessageRef message = messageOf(payload, 4, type);
        const test::AllocationCount allocated = test::allocationsOf([&] {
            if (type != AudioEventTypeJoulery) {
                joulery.handleMessage(message);
            }
            if (type != AudioEventTypeIssueDetector) {
                qmx.handleMessage(message);
            }
        });
        EXPECT_EQ(allocated.blocks, 0U) << type;
    }
    joulery.handleMessage(nullptr);
    qmx.handleMessage(nullptr);
    EXPECT_THAT(device.powerEvents.events, IsEmpty());
    EXPECT_THAT(device.diagnosticsMetrics.records, IsEmpty());
    EXPECT_THAT(device.log.count("Failed to get"), 0);
}

TEST(SinksOfOneType, WorkForEverySessionFromItsCreationOnAndForTheSingleMessageSession) {
    FakePlatform device;
    for (const bool isSingle : {false, true}) {
        device.powerEvents.events.clear();
        device.diagnosticsMetrics.records.clear();
        const auto session = ZRReportingSession::initWithID(5, {1});
        session->setIsSingleMessageSession(isSingle);
        if (isSingle) {
            session->start();
        }
        for (int round = 0; round < 2; ++round) { // a repeat is not offered
            session->sendMessage(messageOf({{"EngineOnTime", 3}}, 4, AudioEventTypeJoulery));
            session->sendMessage(messageOf({{"node", "n"}}, 4, AudioEventTypeIssueDetector));
        }
        ASSERT_EQ(device.powerEvents.events.size(), 1U) << isSingle;
        EXPECT_EQ(device.powerEvents.events[0].payload,
                  (Dictionary{{"EngineOnDuration", 3}, {"TimestampEnd", device.clock.seconds()}}));
        EXPECT_EQ(device.diagnosticsMetrics.records.size(), 1U) << isSingle;
        if (isSingle) {
            session->stop();
        }
    }
}

} // namespace
} // namespace tamblo
