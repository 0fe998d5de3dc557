#include "platform/ProcessList.h"
#include "session/WorkerClass.h"
#include "tests/base/AllocationCount.h"
#include "tests/workers/WorkerTest.h"
#include "tools/MetricRecord.h"
#include "workers/accessories/AccessoryRegistry.h"
#include "workers/accessories/ZRReportingSessionAudioRegistrationWorker.h"
#include "workers/sinks/ZRReportingSessionDPWorker.h"
#include "workers/sinks/ZRReportingSessionEventryWorker.h"
#include "workers/sinks/ZRReportingSessionJouleryWorker.h"
#include "workers/sinks/ZRReportingSessionMemoryLogWorker.h"
#include "workers/sinks/ZRReportingSessionQMXWorker.h"

#include <numeric>

// The list of workers, and those that write into one sink what they are offered or find.

namespace tamblo {
namespace {

/// Without "ZRReportingSession", and without "Worker" at the end.
std::string shortName(const WorkerClass& row) {
    return std::string(row.name.substr(18, row.name.size() - 18 - 6));
}

TEST(WorkerClassListTest, SeventeenRowsInOrderWithTheirAnswers) {
    std::vector<std::string> rows;
    for (const WorkerClass& row : workerClassList()) {
        rows.push_back(shortName(row) + (row.role.producer ? " P" : "") + (row.role.consumer ? " C" : "") +
                       (row.startOnInit ? " I" : "") + (row.handleSingleMessageSession ? " S" : ""));
    }
    EXPECT_THAT(rows, ElementsAre("Trace", "VolumeMessages P", "KaleenMessages P", "Summary P C",
                                  "InputMessages P", "Eventry C I S", "Joulery C I S", "MemoryLog C I",
                                  "QMX C I S", "DriverSnapshot P", "SystemMonitor P", "Zeph C S", "DP C",
                                  "SummaryJsonFile", "AudioRegistration C", "Rtc C S", "Quillet C S"));
}

using WorkersTest = WorkerTest;

TEST_F(WorkersTest, RefuseSessionsOnBuildsAndDevicesThatDoNotWantThem) {
    const struct {
        bool isInternal;
        bool areCapturesWanted;
        AudioServiceType type;
        const char* refusing;
    } cases[] = {
        {false, true, 12, "Trace Zeph DP SummaryJsonFile Quillet "},
        {false, true, AudioServiceTypeTest, "Trace Zeph DP Rtc Quillet "},
        {true, false, 65535, "DP Quillet "},
        {true, true, AudioServiceTypeTest, "Rtc "},
    };
    for (const auto& c : cases) {
        setInternalBuild(c.isInternal);
        for (const char* key : {"enable_stackburst", "TalvixInvalidXyBackOffSeconds"}) {
            const char* domain = "com.vandra.tamblo.zrreporting";
            c.areCapturesWanted ? device.preferences.set(key, domain, 1)
                                : device.preferences.remove(key, domain);
        }
        std::string refusing;
        for (const WorkerClass& row : workerClassList()) {
            const auto worker = row.initWithSession(device.context(), makeSession(c.type));
            refusing += worker == nullptr ? shortName(row) + " " : "";
        }
        EXPECT_EQ(refusing, c.refusing);
    }
}

TEST_F(WorkersTest, AnalyticsEventsHaveAGeneralNameAndOneOfTheService) {
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
        EXPECT_EQ(eventsOf(13, 14, 1), "tamblo.Volume.Start systemsounds.Volume.Start ");
    }
    device.analyticsEvents.setEventsInUse({{"com.vandra.systemsounds.Volume.Start"}});
    EXPECT_EQ(eventsOf(13, 14, 1), "systemsounds.Volume.Start ") << "which are in use is seen at once";
    session.reset();
    worker->handleMessage(messageOf({}, 14, 1));
    EXPECT_THAT(device.analyticsEvents.events(), IsEmpty()) << "the worker holds its session weakly";
}

TEST_F(WorkersTest, PowerEventsAndMetricRecordsHaveWhatThereIs) {
    const auto joulery = make<ZRReportingSessionJouleryWorker>();
    const auto qmx = make<ZRReportingSessionQMXWorker>();
    const struct {
        Value application;
        AudioEventType type;
        const char* payload;
        const char* written; ///< power events, and records as `DURATION ISSUETYPE|NODE|RTAIDCLIENT`
        const char* logged;  ///< a line for each thing that is missing
    } cases[] = {
        {"Unknown", 8, "- EngineOnTime=5s EngineState=EngineOn",
         R"(EngineOnDuration {"EngineOnDuration":"5s"} ClientStatus {"ApplicationName":"Unknown","Status":1} )",
         "ee"},
        {7, 8, "then EngineState=engineOn",
         R"(ClientStatus {"ApplicationName":7,"Status":0,"TimestampEnd":"then"} )", ""},
        {"a", 8, R"(- Haptic_Active_Hardware_Time_Seconds=90 Active_Clients=["b"])",
         R"(LeakedHapticsSessionInfo {"Active_Clients":["b"],"Haptic_Active_Hardware_Time_Seconds":90} )",
         ""},
        {"a", 7, "-", "0 ||", "eeee"},
        {"a", 7, "- issue_type=3 any_channel_silence_seconds=2.9", "2 3||", "ee"},
        {"a", 7, R"(- issue_type="" rtaid_client="" node=0.5 any_channel_silence_seconds=-2.9)", "-2 |0.5|",
         ""},
        {"a", 7, R"(- node=[true] rtaid_client=[1,"x"])", R"(0 |[true]|[1,"x"])", "ee"},
        {"a", 7, "- node=n any_channel_silence_seconds=6442450951", "-2147483641 |n|", "ee"},
    };
    for (const auto& row : cases) {
        session->updateConfigurationWithContentsOfConfiguration(
            {{"HostApplicationDisplayID", row.application}});
        joulery->handleMessage(messageOf(payloadOf(row.payload), 4, row.type));
        qmx->handleMessage(messageOf(payloadOf(row.payload), 0xFFFFFFFF, row.type));
        std::string written;
        for (const auto& event : std::exchange(device.powerEvents.events, {})) {
            EXPECT_EQ(event.subsystem, 28U);
            written += event.name.substr(event.name.starts_with("Korvell_Haptics_") ? 16 : 0) + " " +
                       jsonText(event.payload) + " ";
        }
        for (const auto& [metric, bytes] : std::exchange(device.diagnosticsMetrics.records, {})) {
            EXPECT_EQ(metric, 5963779U);
            tools::ProtoReader reader(bytes);
            qmxmetrics::AudioIssueDetected record;
            EXPECT_TRUE(tools::readRecord(reader, record) && reader.atEnd() && !record.timestamp);
            written += std::to_string(record.duration) + " " + record.issuetype + "|" + record.node + "|" +
                       record.rtaidclient;
        }
        EXPECT_EQ(written, row.written);
        EXPECT_EQ(loggedLevels(row.type == 8 ? ZRReportingJouleryCategory() : ZRReportingQMXLogCategory()),
                  row.logged)
            << row.payload;
    }
}

TEST_F(WorkersTest, ASecondPassesBetweenMemoryRecordsUnlessTheClockIsSetBack) {
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

TEST_F(WorkersTest, OtherMessagesCostThemNothing) {
    device.setThreshold(LogLevel::info);
    const auto joulery = make<ZRReportingSessionJouleryWorker>();
    const auto qmx = make<ZRReportingSessionQMXWorker>();
    const auto memory = make<ZRReportingSessionMemoryLogWorker>();
    const auto captures = make<ZRReportingSessionDPWorker>();
    const std::pair<ZRReportingSessionWorkerConsumerProtocol*, AudioEventType> sinks[] = {
        {joulery.get(), 8}, {qmx.get(), 7}, {memory.get(), 19}, {captures.get(), 6}};
    for (const auto& [worker, own] : sinks) {
        for (const AudioEventType type :
             std::initializer_list<AudioEventType>{0, 6, 7, 8, 19, 263, 264, 275}) {
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
        {Array{12, 1, 12, 13, "14", true, Dictionary{{"a", 3}}, Value::date(5), 6.0}, {1, 2, 12, 13, 6}},
        {Array{0, -1, 0x7FFF'FFFF, 0x8000'0000, ~0ULL, 1e300, NAN}, {1, 2, 0x7FFF'FFFF}},
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

const WallTime kNow{1'772'366'400s}; ///< of the fake clock: 2026-03-01, 12:00
const std::string kEntry = R"("first_seen":"2025-12-31","last_seen":"2026-02-28","last_reported":)";

TEST(AccessoryRegistryTest, ReportsEachAccessoryOnceInADay) {
    const std::string day = R"("last_seen_day":"2026-03-01","model":"m"})";
    const std::string known = R"({"first_seen_day":"2025-12-31",)" + day;
    const std::string isNew = R"({"first_seen_day":"2026-03-01",)" + day;
    const auto reportedAgo = [](std::chrono::seconds time) {
        return "{" + kEntry + std::to_string((kNow - time).time_since_epoch() / 1s) + "}";
    };
    const struct {
        std::string kept; ///< of the accessory that is seen
        std::string report;
        bool hadRubbish = false;
    } cases[] = {
        {reportedAgo(24h - 1s), ""},
        {reportedAgo(24h), known},
        // A clock that was set back, a little or by years.
        {reportedAgo(-24h + 1s), ""},
        {reportedAgo(-24h), known},
        {R"({"first_seen":"2031-01-01","last_seen":"2031-01-01","last_reported":1.5})", isNew},
        // What is no entry.
        {"7", isNew, true},
        {R"({"first_seen":"2026-02-28","last_seen":"yesterday","last_reported":1})", isNew, true},
        {R"({"first_seen":5,"last_seen":"2026-02-28","last_reported":1})", isNew, true},
        {R"({"first_seen":"2026-02-28","last_seen":"2026-02-28","last_reported":"1"})", isNew, true},
    };
    const Accessory seen[] = {{"a", "m"}};
    for (const auto& c : cases) {
        const Value kept = std::get<Value>(readJson("{\"a\":" + c.kept + ",\"b\":{" + kEntry + "1.0}}"));
        const AccessoryRegistry::Update update = AccessoryRegistry::update(kept, seen, kNow);
        EXPECT_EQ(update.reports.empty() ? "" : jsonText(update.reports[0]), c.report) << c.kept;
        EXPECT_EQ(update.hadRubbish, c.hadRubbish) << c.kept;
        const Dictionary& entry = update.registered.find("a")->dictionaryValue();
        EXPECT_EQ(*entry.find("last_seen"), Value("2026-03-01"));
        EXPECT_EQ(entry.find("last_reported")->doubleValue() == secondsSince1970(kNow), !c.report.empty());
        EXPECT_EQ(*update.registered.find("b"), *kept.dictionaryValue().find("b")) << "of another one";
    }
}

TEST(AccessoryRegistryTest, ForgetsThoseUnseenForTheLongestTime) {
    Dictionary kept;
    for (int i = 0; i < 65; ++i) {
        const std::string day = i == 40 ? "2019-01-01" : i == 50 ? "2031-01-01" : "2026-02-28";
        kept.set("k" + std::to_string(i),
                 Dictionary{{"first_seen", day}, {"last_seen", day}, {"last_reported", 1}});
    }
    const Accessory seen[] = {{"new", ""}};
    AccessoryRegistry::Update update = AccessoryRegistry::update(Value(kept), {}, kNow);
    EXPECT_THAT(update.registered, SizeIs(64));
    EXPECT_FALSE(update.registered.contains("k50")) << "of a clock that was wrong";
    update = AccessoryRegistry::update(Value(kept), seen, kNow);
    EXPECT_THAT(update.registered, SizeIs(64));
    EXPECT_FALSE(update.registered.contains("k40"));
    EXPECT_EQ(*update.reports.at(0).find("model"), Value("unknown"));

    std::vector<Accessory> many;
    for (int i = 0; i < 70; ++i) {
        many.push_back({std::to_string(i), "m"});
    }
    update = AccessoryRegistry::update(std::nullopt, many, kNow);
    EXPECT_THAT(update.reports, SizeIs(64));
    EXPECT_THAT(AccessoryRegistry::update(Value(update.registered), many, kNow).reports, IsEmpty());
}

TEST_F(WorkersTest, AccessoriesAreLookedUpAtMostOnceAMinuteAndKept) {
    constexpr const char* domain = "com.vandra.tamblo.accessories";
    const auto kept = [this] {
        const auto value = device.preferences.copyPreferenceValue("registered", domain);
        return value ? jsonText(*value) : "";
    };
    const auto reports = [this] {
        return device.analyticsEvents.payloads("com.vandra.tamblo.accessoryregistration").size();
    };
    const auto startSession = [this](std::chrono::seconds later) {
        device.clock.advance(later);
        (void)startedSession();
        (void)device.serverQueue().runAll();
    };
    startSession(0s);
    EXPECT_EQ(kept(), "") << "nothing to keep";
    device.preferences.set("registered", domain, Array{1});
    startSession(1min);
    EXPECT_EQ(kept(), "{}");
    EXPECT_EQ(loggedLevels(ZRReportingAudioRegistrationCategory()), "e") << "the rubbish";

    device.accessories.earbuds = {{"a", "m"}};
    device.accessories.lookups = 0;
    device.analyticsEvents.setEventsInUse({{"other"}});
    startSession(1min);
    EXPECT_EQ(device.accessories.lookups, 0) << "nobody wants the event";
    device.analyticsEvents.setEventsInUse(std::nullopt);
    device.clock.set(kNow);
    (void)startedSession();
    EXPECT_EQ(reports(), 0U) << "sent on the server queue";
    startSession(0s);
    EXPECT_EQ(reports(), 1U);
    EXPECT_EQ(kept(),
              R"({"a":{"first_seen":"2026-03-01","last_reported":1772366400.0,"last_seen":"2026-03-01"}})");
    const struct {
        std::chrono::seconds step;
        int lookups;
        std::size_t events;
    } cases[] = {{59s, 1, 1}, {1s, 2, 1}, {-3600s, 3, 1}, {59s, 3, 1}, {90'000s, 4, 2}, {-600'000s, 5, 3}};
    for (const auto& c : cases) {
        startSession(c.step);
        EXPECT_EQ(device.accessories.lookups, c.lookups);
        EXPECT_EQ(reports(), c.events);
    }
    EXPECT_EQ(loggedLevels(ZRReportingAudioRegistrationCategory()), "");
}

} // namespace
} // namespace tamblo
