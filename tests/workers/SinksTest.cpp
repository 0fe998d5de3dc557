#include "platform/ProcessList.h"
#include "tests/base/AllocationCount.h"
#include "tests/workers/WorkerTest.h"
#include "tools/MetricRecord.h"
#include "workers/sinks/ZRReportingSessionDPWorker.h"
#include "workers/sinks/ZRReportingSessionEventryWorker.h"
#include "workers/sinks/ZRReportingSessionJouleryWorker.h"
#include "workers/sinks/ZRReportingSessionMemoryLogWorker.h"
#include "workers/sinks/ZRReportingSessionQMXWorker.h"

#include <numeric>

// The workers that write what they are offered into one sink.

namespace tamblo {
namespace {

class SinksTest : public WorkerTest {};

TEST_F(SinksTest, AnalyticsEventsHaveAGeneralNameAndOneOfTheService) {
    const auto worker = make<ZRReportingSessionEventryWorker>();
    const auto eventsOf = [&](AudioServiceType service, AudioEventCategory category, AudioEventType type) {
        session->setServiceType(service);
        worker->handleMessage(messageOf({}, category, type));
        std::string names;
        for (const auto& event : device.analyticsEvents.events()) {
            names += event.name.substr(event.name.find("com.vandra.") + 11) + " ";
        }
        device.analyticsEvents.clear();
        return names;
    };
    for (int i = 0; i < 2; ++i) { // the names are remembered
        EXPECT_EQ(eventsOf(2, 0x08000001, 11),
                  "tamblo.Session_Generic.Summary telephony.Session_Generic.Summary ");
        EXPECT_EQ(eventsOf(99, 0xFFFFFFFF, 65535), "tamblo.Undefined.Unknown unknown.Undefined.Unknown ");
        EXPECT_EQ(eventsOf(0, 14, 1), "tamblo.Volume.Start generic.Volume.Start ");
        EXPECT_EQ(eventsOf(13, 14, 1), "tamblo.Volume.Start systemsounds.Volume.Start ");
    }
    device.analyticsEvents.setEventsInUse({{"com.vandra.systemsounds.Volume.Start"}});
    EXPECT_EQ(eventsOf(13, 14, 1), "systemsounds.Volume.Start ") << "which are in use is seen at once";
    session.reset();
    worker->handleMessage(messageOf({}, 14, 1));
    EXPECT_THAT(device.analyticsEvents.events(), IsEmpty()) << "the worker holds its session weakly";
}

TEST_F(SinksTest, EachPowerTriggerIsAnEventAndWhatIsMissingIsLeftOut) {
    const auto worker = make<ZRReportingSessionJouleryWorker>();
    const struct {
        Value appName;
        Dictionary payload;
        const char* events;
        const char* logged = "";
    } cases[] = {
        {"a", {{"engineontime", 1}, {"Active_Clients", 2}, {"zrreporting_timestamp", 1.5}}, ""},
        {"Unknown",
         {{"EngineOnTime", "5 s"}, {"EngineState", "EngineOn"}},
         R"(EngineOnDuration {"EngineOnDuration":"5 s"} )"
         R"(ClientStatus {"ApplicationName":"Unknown","Status":1} )",
         "ee"},
        {7,
         {{"EngineState", "engineOn"}, {"zrreporting_timestamp", "then"}},
         R"(ClientStatus {"ApplicationName":7,"Status":0,"TimestampEnd":"then"} )"},
        {"a",
         {{"Haptic_Active_Hardware_Time_Seconds", 90}, {"Active_Clients", Array{"b"}}},
         R"(LeakedHapticsSessionInfo {"Active_Clients":["b"],"Haptic_Active_Hardware_Time_Seconds":90} )"},
    };
    for (const auto& row : cases) {
        session->updateConfigurationWithContentsOfConfiguration({{"HostApplicationDisplayID", row.appName}});
        worker->handleMessage(messageOf(row.payload, 4, AudioEventTypeJoulery));
        std::string found;
        for (const auto& event : std::exchange(device.powerEvents.events, {})) {
            EXPECT_EQ(event.subsystem, 28U);
            found += event.name.substr(event.name.starts_with("Korvell_Haptics_") ? 16 : 0) + " " +
                     jsonText(event.payload) + " ";
        }
        EXPECT_EQ(found, row.events);
        EXPECT_EQ(loggedLevels(ZRReportingJouleryCategory()), row.logged) << jsonText(row.payload);
    }
}

TEST_F(SinksTest, EveryDetectedIssueIsAMetricRecordOfWhatThereIs) {
    const auto worker = make<ZRReportingSessionQMXWorker>();
    constexpr const char* silence = "any_channel_silence_seconds";
    const struct {
        Dictionary payload;
        const char* record; ///< `DURATION ISSUETYPE|NODE|RTAIDCLIENT`
        const char* logged; ///< a line for each thing that is missing
    } cases[] = {
        {{}, "0 ||", "eeee"},
        {{{"issue_type", 3}, {silence, 2.9}}, "2 3||", "ee"},
        {{{"issue_type", ""}, {"rtaid_client", ""}, {"node", .5F}, {silence, -2.9}}, "-2 |0.5|", ""},
        {{{"node", Array{true}}, {"rtaid_client", Array{1, "x"}}}, R"(0 |[true]|[1,"x"])", "ee"},
        {{{"node", "n"}, {silence, 0x1'8000'0007}}, "-2147483641 |n|", "ee"},
    };
    for (const auto& row : cases) {
        worker->handleMessage(messageOf(row.payload, 0xFFFFFFFF, AudioEventTypeIssueDetector));
        const auto& [metric, bytes] = device.diagnosticsMetrics.records.back();
        EXPECT_EQ(metric, 5963779U);
        tools::ProtoReader reader(bytes);
        qmxmetrics::AudioIssueDetected record;
        EXPECT_TRUE(tools::readRecord(reader, record) && reader.atEnd() && !record.timestamp);
        EXPECT_EQ(std::to_string(record.duration) + " " + record.issuetype + "|" + record.node + "|" +
                      record.rtaidclient,
                  row.record);
        EXPECT_EQ(loggedLevels(ZRReportingQMXLogCategory()), row.logged) << row.record;
    }
}

TEST_F(SinksTest, ASecondPassesBetweenMemoryRecordsUnlessTheClockIsSetBack) {
    const auto worker = make<ZRReportingSessionMemoryLogWorker>();
    auto& requests = device.memoryLog.requests;
    const MessageRef message = messageOf({{"processIDs", Array{7, kClient}}}, 4, AudioEventTypeMemoryLog);
    const std::pair<std::chrono::nanoseconds, std::size_t> steps[] = {
        {0s, 1},  {0s, 0},    {1s - 1ns, 0}, {1ns, 1}, {1s, 1},
        {-1h, 1}, {999ms, 0}, {-1ns, 0},     {-2s, 1}, {1h, 1}};
    for (const auto& [step, records] : steps) {
        requests.clear();
        device.clock.advance(step);
        worker->handleMessage(message);
        EXPECT_THAT(requests, SizeIs(records)) << step.count();
    }
    EXPECT_EQ(requests[0].reporterID, 5);
    EXPECT_THAT(requests[0].processes, ElementsAre(kClient, kOtherClient, 7));
    session.reset();
    device.clock.advance(1h);
    worker->handleMessage(message);
    EXPECT_THAT(requests, SizeIs(1));
}

TEST_F(SinksTest, OtherMessagesCostThemNothing) {
    device.setThreshold(LogLevel::info);
    const auto joulery = make<ZRReportingSessionJouleryWorker>();
    const auto qmx = make<ZRReportingSessionQMXWorker>();
    const auto memory = make<ZRReportingSessionMemoryLogWorker>();
    const auto captures = make<ZRReportingSessionDPWorker>();
    const std::pair<ZRReportingSessionWorkerConsumerProtocol*, AudioEventType> sinks[] = {
        {joulery.get(), 8}, {qmx.get(), 7}, {memory.get(), 19}, {captures.get(), 6}};
    for (const auto& [worker, own] : sinks) {
        for (const AudioEventType type : {0, 6, 7, 8, 9, 19, 7 + 256, 8 + 256, 19 + 256, 65535}) {
            const MessageRef message = messageOf({{"EngineOnTime", 1}, {"issue_type", 1}}, 7, type);
            const auto allocated = test::allocationsOf([&, sink = worker] { sink->handleMessage(message); });
            EXPECT_EQ(allocated.blocks == 0, type != own) << type;
        }
        worker->handleMessage(nullptr);
    }
}

TEST(ProcessListTest, TakesWhatIsAProcessOnceAndUpToItsLimit) {
    const std::pair<Value, std::vector<pid_t>> cases[] = {
        {12, {1, 2, 12}},
        {Array{12, 1, 12, 13}, {1, 2, 12, 13}},
        {Array{0, -1, 0x7FFF'FFFF, 0x8000'0000, ~0ULL, 1e300, NAN}, {1, 2, 0x7FFF'FFFF}},
        {Array{"12", true, Dictionary{{"a", 3}}, Array{4}, Value::date(5), 6.0}, {1, 2, 6}},
    };
    for (const auto& [named, processes] : cases) {
        ProcessList list;
        list.add(std::vector<pid_t>{1, 2, 1, 0});
        list.addNamedBy({{"processIDs", named}});
        EXPECT_EQ(std::move(list).take(), processes);
    }
    std::vector<pid_t> many(65);
    std::iota(many.begin(), many.end(), 100);
    ProcessList named(512), own;
    named.addNamedBy({{"processIDs", Array(many.begin(), many.end())}});
    own.add(many);
    EXPECT_THAT(std::move(named).take(), SizeIs(64));
    EXPECT_THAT(std::move(own).take(), SizeIs(64));
}

} // namespace
} // namespace tamblo
