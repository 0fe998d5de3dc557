#include "platform/ProcessList.h"
#include "tests/base/AllocationCount.h"
#include "tests/workers/WorkerTest.h"
#include "tools/MetricRecord.h"
#include "workers/sinks/ZRReportingSessionEventryWorker.h"
#include "workers/sinks/ZRReportingSessionJouleryWorker.h"
#include "workers/sinks/ZRReportingSessionMemoryLogWorker.h"
#include "workers/sinks/ZRReportingSessionQMXWorker.h"

#include <cmath>
#include <numeric>

// The workers that write what they are offered into one sink.

namespace tamblo {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;
using Lines = std::vector<std::string>;

class SinksTest : public WorkerTest {
protected:
    Lines analyticsEvents() {
        Lines found;
        for (const auto& event : device.analyticsEvents.events()) {
            found.push_back(event.name + " " + shown(event.payload, {"n"}));
        }
        device.analyticsEvents.clear();
        return found;
    }
    Lines powerEvents() {
        Lines found;
        for (const auto& event : std::exchange(device.powerEvents.events, {})) {
            EXPECT_EQ(event.subsystem, 28U);
            found.push_back(event.name + " " + jsonText(event.payload));
        }
        return found;
    }
    /// `DURATION ISSUETYPE|NODE|RTAIDCLIENT` of each metric record.
    Lines metricRecords() {
        Lines found;
        for (const auto& [metric, bytes] : std::exchange(device.diagnosticsMetrics.records, {})) {
            EXPECT_EQ(metric, 5963779U);
            tools::ProtoReader reader(bytes);
            qmxmetrics::AudioIssueDetected record;
            EXPECT_TRUE(tools::readRecord(reader, record) && reader.atEnd());
            EXPECT_FALSE(record.timestamp);
            found.push_back(std::to_string(record.duration) + " " + record.issuetype + "|" + record.node +
                            "|" + record.rtaidclient);
        }
        return found;
    }
};

TEST_F(SinksTest, AnalyticsEventsHaveAGeneralNameAndOneOfTheService) {
    const auto worker = make<ZRReportingSessionEventryWorker>();
    const struct {
        AudioServiceType service;
        AudioEventCategory category;
        AudioEventType type;
        const char* general;
        const char* ofService;
    } cases[] = {
        {2, 0x08000001, 11, "tamblo.Session_Generic.Summary", "telephony.Session_Generic.Summary"},
        {99, 0xFFFFFFFF, 65535, "tamblo.Undefined.Unknown", "unknown.Undefined.Unknown"},
        {98, 0xFFFFFFFF, 0, "tamblo.Undefined.Generic", "unknown.Undefined.Generic"},
        {0, 14, 1, "tamblo.Volume.Start", "generic.Volume.Start"},
        {13, 14, 1, "tamblo.Volume.Start", "systemsounds.Volume.Start"},
    };
    const std::string maker = "com.vandra.";
    for (const auto& c : cases) {
        for (const char* number : {" 0", " 1"}) {
            session->setServiceType(c.service);
            worker->handleMessage(messageOf({{"n", number[1] - '0'}}, c.category, c.type));
            EXPECT_THAT(analyticsEvents(),
                        ElementsAre(maker + c.general + number, maker + c.ofService + number));
        }
    }
    // The names are remembered; which of them are in use is seen at once.
    device.analyticsEvents.setEventsInUse({{"com.vandra.systemsounds.Volume.Start"}});
    worker->handleMessage(messageOf({{"n", 2}}, 14, 1));
    device.analyticsEvents.setEventsInUse(std::nullopt);
    worker->handleMessage(messageOf({{"n", 3}}, 14, 1));
    EXPECT_THAT(analyticsEvents(),
                ElementsAre("com.vandra.systemsounds.Volume.Start 2", "com.vandra.tamblo.Volume.Start 3",
                            "com.vandra.systemsounds.Volume.Start 3"));
    session.reset();
    worker->handleMessage(messageOf({{"n", 4}}, 14, 1));
    EXPECT_THAT(analyticsEvents(), IsEmpty()) << "the worker holds its session weakly";
}

TEST_F(SinksTest, EachPowerTriggerIsAnEventAndWhatIsMissingIsLeftOut) {
    const auto worker = make<ZRReportingSessionJouleryWorker>();
    const std::string engineOn = "Korvell_Haptics_EngineOnDuration ",
                      status = "Korvell_Haptics_ClientStatus ";
    const struct {
        Value appName;
        Dictionary payload;
        Lines events;
        const char* logged = "";
    } cases[] = {
        {"com.a", {{"engineontime", 1}, {"Active_Clients", 2}, {"zrreporting_timestamp", 1.5}}, {}},
        {"com.a",
         {{"EngineOnTime", 2.5F}, {"zrreporting_timestamp", 1.5}},
         {engineOn + R"({"ApplicationName":"com.a","EngineOnDuration":2.5,"TimestampEnd":1.5})"}},
        {"Unknown",
         {{"EngineOnTime", "5 s"}, {"EngineState", "EngineOn"}},
         {engineOn + R"({"EngineOnDuration":"5 s"})", status + R"({"ApplicationName":"Unknown","Status":1})"},
         "ee"},
        {7,
         {{"EngineState", "engineOn"}, {"zrreporting_timestamp", "then"}},
         {status + R"({"ApplicationName":7,"Status":0,"TimestampEnd":"then"})"}},
        {"com.a",
         {{"Haptic_Active_Hardware_Time_Seconds", 90}, {"Active_Clients", Array{"a"}}, {"EngineOnTime", 3}},
         {engineOn + R"({"ApplicationName":"com.a","EngineOnDuration":3})",
          R"(LeakedHapticsSessionInfo {"Active_Clients":["a"],"Haptic_Active_Hardware_Time_Seconds":90})"},
         "e"},
    };
    for (const auto& row : cases) {
        session->updateConfigurationWithContentsOfConfiguration({{"HostApplicationDisplayID", row.appName}});
        worker->handleMessage(messageOf(row.payload, 4, AudioEventTypeJoulery));
        EXPECT_EQ(powerEvents(), row.events);
        EXPECT_EQ(loggedLevels(ZRReportingJouleryCategory()), row.logged) << jsonText(row.payload);
    }
    session.reset();
    worker->handleMessage(messageOf({{"EngineOnTime", 1}, {"EngineState", ""}}, 4, AudioEventTypeJoulery));
    EXPECT_THAT(powerEvents(),
                ElementsAre(engineOn + R"({"EngineOnDuration":1})", status + R"({"Status":0})"));
}

TEST_F(SinksTest, EveryDetectedIssueIsAMetricRecordOfWhatThereIs) {
    const auto worker = make<ZRReportingSessionQMXWorker>();
    constexpr const char* kSilence = "any_channel_silence_seconds";
    const struct {
        Dictionary payload;
        std::string record;
        std::string logged; ///< a line for each thing that is missing
    } cases[] = {
        {{}, "0 ||", "eeee"},
        {{{"issue_type", 3}, {kSilence, 2.9}}, "2 3||", "ee"},
        {{{"issue_type", ""}, {"rtaid_client", ""}, {"node", .5F}, {kSilence, -2.9}}, "-2 |0.5|", ""},
        {{{"node", Array{true}}, {"rtaid_client", Array{1, "x"}}}, R"(0 |[true]|[1,"x"])", "ee"},
        {{{"node", "n"}, {kSilence, 0x1'8000'0007}}, "-2147483641 |n|", "ee"},
        {{{"node", "n"}, {kSilence, " 12.7 s"}}, "12 |n|", "ee"},
        {{{"node", "n"}, {kSilence, std::nan("")}}, "0 |n|", "ee"},
    };
    for (const auto& row : cases) {
        worker->handleMessage(messageOf(row.payload, 0xFFFFFFFF, AudioEventTypeIssueDetector));
        EXPECT_THAT(metricRecords(), ElementsAre(row.record));
        EXPECT_EQ(loggedLevels(ZRReportingQMXLogCategory()), row.logged) << row.record;
    }
    worker->handleMessage(messageOf({}, 4, AudioEventTypeIssueDetector));
    EXPECT_EQ(device.diagnosticsMetrics.records.back().second,
              (std::vector<std::uint8_t>{0x10, 0, 0x1A, 0, 0x22, 0, 0x2A, 0}));
}

TEST_F(SinksTest, ASecondPassesBetweenMemoryRecordsUnlessTheClockIsSetBack) {
    const auto worker = make<ZRReportingSessionMemoryLogWorker>();
    auto& requests = device.memoryLog.requests;
    const auto handle = [&] {
        worker->handleMessage(messageOf({{"processIDs", Array{7, kClient}}}, 4, AudioEventTypeMemoryLog));
        return std::exchange(requests, {}).size();
    };
    const std::pair<std::chrono::nanoseconds, std::size_t> steps[] = {
        {0s, 1},  {0s, 0},    {1s - 1ns, 0}, {1ns, 1}, {1s, 1},
        {-1h, 1}, {999ms, 0}, {-1ns, 0},     {-2s, 1}, {1h, 1}};
    for (const auto& [step, records] : steps) {
        device.clock.advance(step);
        EXPECT_EQ(handle(), records) << step.count();
    }
    // The session's own worker takes repeats.
    for (int i = 0; i < 2; ++i) {
        send({{"processIDs", Array{7, kClient}}}, 4, AudioEventTypeMemoryLog);
        device.clock.advance(1s);
    }
    ASSERT_THAT(requests, SizeIs(2));
    EXPECT_EQ(requests.back().reporterID, 5);
    EXPECT_THAT(requests.back().processes, ElementsAre(kClient, kOtherClient, 7));
    requests.clear();
    session.reset();
    EXPECT_EQ(handle(), 0U);
}

TEST_F(SinksTest, OtherMessagesCostThemNothing) {
    const auto joulery = make<ZRReportingSessionJouleryWorker>();
    const auto qmx = make<ZRReportingSessionQMXWorker>();
    const auto memory = make<ZRReportingSessionMemoryLogWorker>();
    const struct {
        ZRReportingSessionWorkerConsumerProtocol& worker;
        AudioEventType own;
    } sinks[] = {{*joulery, 8}, {*qmx, 7}, {*memory, 19}};
    constexpr AudioEventType types[] = {0, 6, 7, 8, 9, 19, 20, 7 + 256, 8 + 256, 19 + 256, 65535};
    for (const auto& [worker, own] : sinks) {
        for (const AudioEventType type : types) {
            const MessageRef message = messageOf({{"EngineOnTime", 1}, {"issue_type", 1}}, 4, type);
            const auto allocated = test::allocationsOf([&, &sink = worker] { sink.handleMessage(message); });
            EXPECT_EQ(allocated.blocks == 0, type != own) << type;
        }
        worker.handleMessage(nullptr);
    }
    EXPECT_THAT(powerEvents(), SizeIs(1));
    EXPECT_THAT(metricRecords(), SizeIs(1));
    EXPECT_THAT(device.memoryLog.requests, SizeIs(1));
}

TEST_F(SinksTest, WorkFromTheSessionsCreationOnAndForTheSingleMessageSession) {
    for (const bool isSingle : {false, true}) {
        session = makeSession(AudioServiceTypeHaptics);
        session->setIsSingleMessageSession(isSingle);
        if (isSingle) {
            session->start();
        }
        for (int round = 0; round < 2; ++round) { // a repeat is not offered
            send({{"Engine OnTime", 3}, {"EngineOnTime", 3}}, 4, AudioEventTypeJoulery);
            send({{"node", "n"}}, 4, AudioEventTypeIssueDetector);
        }
        EXPECT_THAT(powerEvents(),
                    ElementsAre(R"(Korvell_Haptics_EngineOnDuration {"EngineOnDuration":3,"TimestampEnd":)" +
                                jsonText(device.clock.seconds()) + "}"));
        EXPECT_THAT(metricRecords(), SizeIs(1));
        const auto payloads = device.analyticsEvents.payloads("com.vandra.haptics.Playback.Joulery");
        ASSERT_THAT(payloads, SizeIs(1));
        EXPECT_EQ(payloads.front(), (Dictionary{{"EngineOnTime", 3},
                                                {"Engine_OnTime", 3},
                                                {"audiotag", "PlaybackJoulery"},
                                                {"HostApplicationDisplayID", "Unknown"},
                                                {"invalid_timestamp", "nil"},
                                                {"zrreporting_timestamp", device.clock.seconds()}}));
        device.analyticsEvents.clear();
        if (isSingle) {
            session->stop();
        }
    }
}

TEST(ProcessListTest, TakesWhatIsAProcessOnceAndUpToItsLimit) {
    const std::pair<Value, std::vector<pid_t>> cases[] = {
        {12, {1, 2, 12}},
        {Array{12, 1, 12, 13}, {1, 2, 12, 13}},
        {Array{0, -1, 0x7FFF'FFFF, 0x8000'0000, 0x1'0000'0003, ~0ULL, 1e300, std::nan("")},
         {1, 2, 0x7FFF'FFFF}},
        {Array{"12", true, Dictionary{{"a", 3}}, Array{4}, Value::date(5), 6.0}, {1, 2, 6}},
        {"12", {1, 2}},
    };
    for (const auto& [named, processes] : cases) {
        ProcessList list;
        list.add(std::vector<pid_t>{1, 2, 1, 0});
        list.addNamedBy({{"processIDs", named}});
        EXPECT_EQ(std::move(list).take(), processes);
    }
    for (const std::size_t count : {64U, 65U}) {
        std::vector<pid_t> many(count);
        std::iota(many.begin(), many.end(), 100);
        ProcessList named(512), own;
        named.addNamedBy({{"processIDs", Array(many.begin(), many.end())}});
        own.add(many);
        EXPECT_THAT(std::move(named).take(), SizeIs(64));
        EXPECT_THAT(std::move(own).take(), SizeIs(64));
    }
}

} // namespace
} // namespace tamblo
