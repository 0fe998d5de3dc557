#include "base/Format.h"
#include "platform/Counters.h"
#include "platform/ProcessList.h"
#include "session/WorkerClass.h"
#include "tests/workers/WorkerTest.h"
#include "tools/MetricRecord.h"
#include "workers/accessories/AccessoryRegistry.h"
#include "workers/accessories/ZRReportingSessionAudioRegistrationWorker.h"
#include "workers/sinks/LinkmeterSummary.h"
#include "workers/sinks/ZRReportingSessionEventryWorker.h"
#include "workers/sinks/ZRReportingSessionJouleryWorker.h"
#include "workers/sinks/ZRReportingSessionMemoryLogWorker.h"
#include "workers/sinks/ZRReportingSessionQMXWorker.h"

#include <algorithm>
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
            device.preferences.values.erase({domain, key});
            if (c.areCapturesWanted) {
                device.preferences.setPreferenceValue(key, domain, 1);
            }
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
        for (const auto& event : device.analyticsEvents.events) {
            names += event.name.substr(event.name.find("com.vandra.") + 11) + " ";
        }
        device.analyticsEvents.events.clear();
        return names;
    };
    for (int i = 0; i < 2; ++i) { // the names are remembered
        EXPECT_EQ(eventsOf(2, 0x08000001, 1),
                  "tamblo.Session_Generic.Start telephony.Session_Generic.Start ");
        EXPECT_EQ(eventsOf(99, 0xFFFFFFFF, 65535), "tamblo.Undefined.Unknown unknown.Undefined.Unknown ");
        EXPECT_EQ(eventsOf(13, 14, 1), "tamblo.Volume.Start systemsounds.Volume.Start ");
    }
    device.analyticsEvents.setEventsInUse({{"com.vandra.systemsounds.Volume.Start"}});
    EXPECT_EQ(eventsOf(13, 14, 1), "systemsounds.Volume.Start ") << "which are in use is seen at once";
}

TEST_F(WorkersTest, PowerEventsAndMetricRecordsHaveWhatThereIs) {
    const auto joulery = make<ZRReportingSessionJouleryWorker>();
    const auto qmx = make<ZRReportingSessionQMXWorker>();
    const struct {
        Value application;
        AudioEventType type;
        const char* payload;
        const char* written;     ///< power events, and records as `DURATION ISSUETYPE|NODE|RTAIDCLIENT`
        const char* logged = ""; ///< a line for each thing that is missing
    } cases[] = {
        {"Unknown", 8, "- EngineOnTime=5s EngineState=EngineOn",
         R"(EngineOnDuration {"EngineOnDuration":"5s"} ClientStatus {"ApplicationName":"Unknown","Status":1} )",
         "ee"},
        {7, 8, "then EngineState=engineOn",
         R"(ClientStatus {"ApplicationName":7,"Status":0,"TimestampEnd":"then"} )"},
        {"a", 8, R"(- Haptic_Active_Hardware_Time_Seconds=90 Active_Clients=["b"])",
         R"(LeakedHapticsSessionInfo {"Active_Clients":["b"],"Haptic_Active_Hardware_Time_Seconds":90} )"},
        {"a", 7, "-", "0 ||", "eeee"},
        {"a", 7, R"(- issue_type="" rtaid_client="" node=0.5 any_channel_silence_seconds=-2.9)", "-2 |0.5|"},
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
    worker->handleMessage(messageOf({}, 4, 256 + AudioEventTypeMemoryLog));
    const std::pair<std::chrono::nanoseconds, std::size_t> steps[] = {
        {0s, 1}, {1s - 1ns, 1}, {1ns, 2}, {-1h, 3}, {999ms, 3}, {-1ns, 3}, {-2s, 4}};
    for (const auto& [step, records] : steps) {
        device.clock.advance(step);
        worker->handleMessage(message);
        EXPECT_THAT(requests, SizeIs(records)) << step.count();
    }
    EXPECT_THAT(requests[0], testing::Pair(5, ElementsAre(kClient, kOtherClient, 7)));
}

TEST(ProcessListTest, TakesWhatIsAProcessOnceAndUpToItsLimit) {
    ProcessList list;
    list.add(std::vector<pid_t>{1, 2, 1, 0});
    list.addNamedBy({{"processIDs", 12}});
    list.addNamedBy({{"processIDs", Array{12, 1, 13, 13, "14", true, Dictionary{{"a", 3}}, 6.0}}});
    list.addNamedBy({{"processIDs", Array{0, -1, 0x7FFF'FFFF, 0x8000'0000, ~0ULL, 1e300, NAN}}});
    EXPECT_EQ(list.leftOut(), 10);
    EXPECT_THAT(std::move(list).take(), ElementsAre(1, 2, 12, 13, 6, 0x7FFF'FFFF));
    std::vector<pid_t> many(65);
    std::iota(many.begin(), many.end(), 100);
    ProcessList named(512), own;
    named.addNamedBy({{"processIDs", Array(many.begin(), many.end())}});
    own.add(many);
    EXPECT_EQ(named.leftOut(), 1);
    EXPECT_EQ(own.leftOut(), 1);
    EXPECT_THAT(std::move(named).take(), SizeIs(64));
    EXPECT_THAT(std::move(own).take(), SizeIs(64));
}

const std::string kEntry = R"("first_seen":"2025-12-31","last_seen":"2026-02-28","last_reported":)";

TEST(AccessoryRegistryTest, ReportsEachAccessoryOnceInADay) {
    const auto reportedAgo = [](std::chrono::seconds time) {
        return "{" + kEntry + std::to_string((kStart - time).time_since_epoch() / 1s) + "}";
    };
    const struct {
        std::string kept;     ///< of the accessory that is seen
        std::string reported; ///< the day on which it was first seen, when it is reported
        bool hadRubbish = false;
    } cases[] = {
        {reportedAgo(24h - 1s), ""},
        {reportedAgo(24h), "2025-12-31"},
        // A clock that was set back, a little or by years.
        {reportedAgo(-24h + 1s), ""},
        {reportedAgo(-24h), "2025-12-31"},
        {R"({"first_seen":"2031-01-01","last_seen":"2031-01-01","last_reported":1.5})", "2026-03-01"},
        // What is no entry.
        {"7", "2026-03-01", true},
        {R"({"first_seen":"2026-02-28","last_seen":"yesterday","last_reported":1})", "2026-03-01", true},
        {R"({"first_seen":"2026-02-28","last_seen":"2026-02-28","last_reported":"1"})", "2026-03-01", true},
    };
    const Accessory seen[] = {{"a", "m"}};
    for (const auto& c : cases) {
        const Value kept = std::get<Value>(readJson("{\"a\":" + c.kept + ",\"b\":{" + kEntry + "1.0}}"));
        const AccessoryRegistry::Update update = AccessoryRegistry::update(kept, seen, kStart);
        EXPECT_EQ(update.reports.empty()
                      ? ""
                      : shown(update.reports[0], {"first_seen_day", "last_seen_day", "model"}),
                  c.reported.empty() ? "" : "\"" + c.reported + R"(" "2026-03-01" "m")")
            << c.kept;
        EXPECT_EQ(update.hadRubbish, c.hadRubbish) << c.kept;
        const Dictionary& entry = update.registered.find("a")->dictionaryValue();
        EXPECT_EQ(*entry.find("last_seen"), Value("2026-03-01"));
        EXPECT_EQ(entry.find("last_reported")->doubleValue() == secondsSince1970(kStart),
                  !c.reported.empty());
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
    AccessoryRegistry::Update update = AccessoryRegistry::update(Value(kept), {}, kStart);
    EXPECT_THAT(update.registered, SizeIs(64));
    EXPECT_FALSE(update.registered.contains("k50")) << "of a clock that was wrong";
    update = AccessoryRegistry::update(Value(kept), seen, kStart);
    EXPECT_THAT(update.registered, SizeIs(64));
    EXPECT_FALSE(update.registered.contains("k40"));
    EXPECT_EQ(*update.reports.at(0).find("model"), Value("unknown"));
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
        makeSession()->start();
        device.serverQueue().runAll();
    };
    device.preferences.setPreferenceValue("registered", domain, Array{1});
    startSession(1min);
    EXPECT_EQ(kept(), "{}");
    EXPECT_EQ(loggedLevels(ZRReportingAudioRegistrationCategory()), "e") << "the rubbish";

    device.accessories.earbuds = {{"a", "m"}};
    device.analyticsEvents.setEventsInUse({{"other"}});
    startSession(1min);
    EXPECT_EQ(std::exchange(device.accessories.lookups, 0), 1) << "nobody wants the event";
    device.analyticsEvents.setEventsInUse(std::nullopt);
    device.clock.set(kStart);
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
}

/// The call-quality service answers, and the worker's queue runs, when a test says so.
class RtcWorkerTest : public WorkerTest {
protected:
    RtcWorkerTest() { session = makeSession(AudioServiceTypeTelephony); }

    void sendNumber(int n, Dictionary payload = {}) {
        payload.set("n", n);
        send(std::move(payload), 0x08000004, 1);
    }
    /// A number is sent as a message, or is a time in milliseconds; a configuration that waits is answered
    /// with "found" back ends, or "none".
    void play(const std::string& script) {
        playWords(script,
                  {{"start", [this] { session->start(); }},
                   {"stop", [this] { session->stop(); }},
                   {"drop", [this] { session.reset(); }},
                   {"tokenless", [this] { device.callQuality.token.reset(); }},
                   {"run", [this] { device.workQueues.run("com.vandra.tamblo.session.linkmeter"); }},
                   {"found", [this] { device.callQuality.findBackends(std::vector<std::string>(2, "one")); }},
                   {"none", [this] { device.callQuality.findBackends(std::nullopt); }},
                   {"fails", [this] { device.callQuality.sendFailure = "no room"; }},
                   {"works", [this] { device.callQuality.sendFailure.reset(); }}},
                  [this](const std::string& word) {
                      const int number = std::stoi(word);
                      word.ends_with("ms") ? device.workQueues.elapse(std::chrono::milliseconds(number))
                                           : sendNumber(number);
                  });
    }
    /// The values of the key in the messages that a Linkmeter session was given: the summary's in brackets,
    /// an "s" for the session's own summary, which its stop sends, and an "f" if it was flushed.
    static std::string sent(const FakeCallQualityService::FakeSession& made, std::string_view key = "n") {
        std::string text;
        for (const auto& message : made.messages) {
            const Value* found = message.payload.find(key);
            const std::string value = found != nullptr ? formatted("{}", *found) : "";
            const bool isSummary = message.category == 0xFFFF && message.type == 0xFFFF;
            text += message.type == AudioEventTypeSummary ? "s" : isSummary ? "[" + value + "]" : value;
        }
        return text + std::string(static_cast<std::size_t>(made.flushes), 'f');
    }
    /// What all Linkmeter sessions were sent, with a "+" for each that somebody besides the fake holds, how
    /// many waits there are, and an "e" for each error that the log tells.
    std::string outcome() {
        std::string text;
        for (const auto& made : device.callQuality.sessions) {
            text += sent(*made) + (made.use_count() > 1 ? "+" : "") + "/";
        }
        const std::string levels = loggedLevels(ZRReportingSessionLinkmeterCategory());
        const std::uint64_t lost = countOfLost();
        return text + std::to_string(device.workQueues.delayedCalls()) +
               std::string(static_cast<std::size_t>(std::ranges::count(levels, 'e')), 'e') +
               std::string(lost - std::exchange(lost_, lost), '-');
    }

private:
    static std::uint64_t countOfLost() {
        using counters::Counter;
        return counters::valueOf(counters::slotOf(Counter::messagesLostNoBackEnds)) +
               counters::valueOf(counters::slotOf(Counter::messagesLostSessionGone));
    }

    std::uint64_t lost_ = countOfLost();
};

TEST_F(RtcWorkerTest, DescribesTheSessionToTheService) {
    session = makeSession(AudioServiceTypeTelephony,
                          {{"ClientName", "other"}, {"HostApplicationDisplayID", "app"}, {"x", 1}});
    session->setIsSingleMessageSession(true);
    play("start run");
    const auto& made = *device.callQuality.sessions.back();
    EXPECT_EQ(shown(made.sessionInfo, {"BatchEvent", "ContainsRealtimeEvents", "ClientBundleID"}),
              R"(true false "app")");
    EXPECT_EQ(shown(made.userInfo, {"ClientName", "ServiceName", "x"}), R"("other" "telephony" 1)");
}

TEST_F(RtcWorkerTest, SetsUpThenSendsInOrderWhateverComesOfIt) {
    const Played cases[] = {
        {"what is handed in meanwhile follows", "start 1 run 2 run", "+/1"},
        {"at once where nothing waits", "start run found 1", "1+/0"},
        {"else behind what waits", "start 1 run found 2 run 3", "123+/0"},
        {"back ends at the last moment", "start 1 run 2 run stop run 8999ms found 9000ms run", "12s[1,2]f/0"},
        {"no back ends", "start 1 run 2 run stop run none run", "+/0e----"},
        {"none, and too late", "start 1 run 2 run stop run 9000ms none run", "/0e----"},
        {"found too late, before what waited has run", "start 1 run stop run 9000ms found run", "/0---"},
        {"one that cannot be sent", "start run found run fails 1 run works 2 run", "2+/0e"},
        {"two runs before the queue gets to them", "start run found 1 stop 2 start 3 stop run", "1s[1]f/+/1"},
        {"each set up anew", "start run found 1 stop 2 start 3 stop run found run", "1s[1]f/3s[3]f/0"},
        {"found after it: on, without a session", "start run 9000ms run found 1 run", "/0-"},
        {"the next run is not on", "start run 9000ms run found stop start 1 run", "/+/0---"},
        {"until its own are found", "start run 9000ms run found stop start run found 1 run", "/1+/0--"},
        {"a dropped session leaves nothing", "start run 1 drop run found run", "/0-"},
        {"a stopped one is reported in full", "start run 1 stop drop run found run", "1s[1]f/0"},
        {"whenever it was dropped", "start 1 stop drop run found run", "1s[1]f/0"},
        {"without a token nothing is opened", "tokenless start 1 stop run", "0e---"},
    };
    for (const auto& row : cases) {
        device.callQuality.sessions.clear();
        device.callQuality.completions.clear();
        session = makeSession(AudioServiceTypeTelephony);
        device.log.clear();
        (void)outcome();
        play(row.script);
        EXPECT_EQ(outcome(), row.expected) << row.what;
        play("drop 9000ms run");
    }
}

TEST_F(RtcWorkerTest, TheSummaryJoinsWhatWasSentOnceWhileStarted) {
    const auto& sessions = device.callQuality.sessions;
    sendNumber(0, {{"early", true}});
    play("start run found");
    sendNumber(1, {{"zrreporting_timestamp", 4e9}});
    sendNumber(1, {{"zrreporting_timestamp", 4e9}});
    const MessageRef elsewhere = messageOf({{"n", 2}, {"zrreporting_timestamp", 5e9}}, 4, 1);
    elsewhere->setDestinationWorkers({workerClassNamed("ZRReportingSessionEventryWorker")});
    session->sendMessage(elsewhere);
    play("run stop run");
    EXPECT_EQ(sessions[0]->messages[0].category, 4) << "the kind";
    EXPECT_EQ(outcome(), "1s[1,2]f/0") << "the destinations count for the sending alone";
    EXPECT_EQ(sent(*sessions[0], "zrreporting_timestamp"), "s[]f") << "outside internal builds";
    EXPECT_EQ(shown(sessions[0]->messages.back().payload, {"ZR_Session_Summary_Event", "early"}), "\"2\"");
}

TEST(LinkmeterSummaryTest, ValuesAreTextsInTheOrderOfTheMessages) {
    const std::vector<Dictionary> payloads{
        {{"a", ""}, {"b", true}, {"c", Array{1, "x"}}},
        {{"a", "x"}, {"b", 0.5F}, {"ZR_Session_Summary_Event", "mine"}},
        {{"a", "y,z"}, {"b", NAN}, {"d", Value::date(0)}},
        {{"a", Dictionary{{"k", 1}}}, {"b", ~0ULL}, {"c", Value::data({})}}};
    EXPECT_EQ(LinkmeterSummary::of(payloads, AudioServiceTypeUnknown).values,
              (Dictionary{{"a", R"(,x,y,z,{"k":1})"},
                          {"b", "true,0.5,null,18446744073709551615"},
                          {"c", R"([1,"x"],"")"},
                          {"d", R"("1970-01-01T00:00:00.000Z")"},
                          {"ZR_Session_Summary_Event", "65535,mine"}}));

    const std::string large(1U << 20U, 'x');
    const std::vector<Dictionary> many(
        3, {{"a", large}, {"b", large}, {"c", large}, {"d", large}, {"e", "beyond all"}});
    const LinkmeterSummary full = LinkmeterSummary::of(many, AudioServiceTypeUnknown);
    EXPECT_EQ(full.values.find("d")->stringValue(), large + ",(...)");
    EXPECT_EQ(*full.values.find("e"), Value("(...)"));
    EXPECT_EQ(full.leftOut, 4U * 2 + 3);
}

} // namespace
} // namespace tamblo
