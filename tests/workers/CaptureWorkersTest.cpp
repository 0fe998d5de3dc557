#include "tests/workers/WorkerTest.h"
#include "workers/sinks/ZRReportingSessionDPWorker.h"
#include "workers/sinks/ZRReportingSessionQuilletWorker.h"

#include <thread>

// The workers that draft bug reports, capture stacks and ask for bug captures.

namespace tamblo {
namespace {

constexpr const char* kDomain = "com.vandra.tamblo.zrreporting";
constexpr const char* kSize = "smallest_buffer_frame_size";
constexpr const char* kCycle = "io_cycle";

struct Sent {
    Dictionary payload;
    AudioEventCategory category;
    AudioEventType type;
};
const Dictionary kOpened{{"success", true}, {"session_id", "S-1"}};

class CaptureWorkersTest : public WorkerTest {
protected:
    using Worker = ZRReportingSessionDPWorker;
    CaptureWorkersTest() : WorkerTest(LogLevel::debug, true) {
        device.deviceProperties.properties["HapticLeakCapture"] = true;
        prefer("TalvixInvalidXyBackOffSeconds", "60.5 s");
        prefer("enable_stackburst", "YES");
    }
    void prefer(const std::string& key, const Value& value) {
        device.preferences.setPreferenceValue(key, kDomain, value);
    }
    /// What a new worker makes of messages, which are told by their times: a "d" for each that is drafted,
    /// a "." for each that is not. "x" has another key, "+" sets the clock on.
    std::string drafts(const std::string& script) {
        const auto worker = tryToMake<ZRReportingSessionQuilletWorker>();
        std::string made;
        playWords(script, {{"stop", [&worker] { worker->stop(); }}, {"drop", [this] { session.reset(); }}},
                  [&](const std::string& word) {
                      if (word.starts_with('+')) {
                          device.clock.advance(std::chrono::milliseconds(std::stoi(word)));
                          return;
                      }
                      const bool isOther = word.starts_with('x');
                      const std::size_t before = device.bugReportDrafting.requests.size();
                      worker->handleMessage(
                          messageOf({{isOther ? "Tvac_invalid_x" : "tvac_invalid_x", 1},
                                     {"zrreporting_timestamp", 1e9 + std::stod(word.substr(isOther))}}));
                      runQueues();
                      made += device.bugReportDrafting.requests.size() == before ? "." : "d";
                  });
        return made;
    }
    void runQueues() {
        device.workQueues.run("com.vandra.tamblo.reporting.blocking");
        device.serverQueue().runAll();
    }
    /// Whether an overload with these is captured.
    bool isCaptured(Worker& worker, const Dictionary& payload, AudioEventType type = 6,
                    AudioEventCategory category = 7) {
        const std::size_t before = device.diagnosticCapture.requests.size();
        worker.handleMessage(messageOf(payload, category, type));
        return device.diagnosticCapture.requests.size() != before;
    }
    void startSession(AudioServiceType type, bool isSingle = false) {
        session = makeSession(type);
        session->setIsSingleMessageSession(isSingle);
        session->start();
    }
    /// A number is a time in seconds; what is a message is sent now.
    void play(const std::string& script) {
        playWords(script,
                  {{"alarms", [this] { startSession(AudioServiceTypeAlarms); }},
                   {"alerts", [this] { startSession(AudioServiceTypeAlerts); }},
                   {"test", [this] { startSession(AudioServiceTypeTest); }},
                   {"single", [this] { startSession(AudioServiceTypeAlarms, true); }},
                   {"start", [this] { session->start(); }},
                   {"stop", [this] { session->stop(); }},
                   {"answered", [this] { device.bugCapture.answer(kOpened); }},
                   {"failed",
                    [this] {
                        device.bugCapture.answer({{"reason", 1}});
                    }},
                   {"refused", [this] { device.bugCapture.accepts = false; }}},
                  [this](const std::string& word) {
                      if (const auto message = lookUp(messages, word)) {
                          device.clock.advance(1ms);
                          send(message->payload, message->category, message->type);
                      } else {
                          device.clock.advance(std::chrono::seconds(std::stoi(word)));
                      }
                  });
    }
    const std::map<std::string, Sent> messages{
        {"haptic", {payloadOf("- Haptic_Active_Hardware_Time_Seconds=90"), 4, 8}},
        {"sound", {payloadOf("- System_Sound_Stuck_Time_Seconds=90"), 4, 8}},
        {"both",
         {payloadOf("- Haptic_Active_Hardware_Time_Seconds=x System_Sound_Stuck_Time_Seconds=0"), ~0U, 8}},
        {"issue",
         {payloadOf("- Haptic_Active_Hardware_Time_Seconds System_Sound_Stuck_Time_Seconds"), 11, 7}},
        {"low", {payloadOf("- issue_type=LowRMS"), 11, 7}},
        {"lowercase", {payloadOf("- issue_type=lowRMS"), 11, 7}},
        {"low-of-session", {payloadOf("- issue_type=LowRMS"), 0x0800000B, 7}},
        {"low-error", {payloadOf("- issue_type=LowRMS"), 11, 6}}};
    const Dictionary overload{{kSize, 512}, {kCycle, 3}};
};

TEST_F(CaptureWorkersTest, DraftsFiveSecondsAfterTheFirstMessageOnceInARunAndInABackOffPeriod) {
    const auto& requests = device.bugReportDrafting.requests;
    EXPECT_EQ(drafts("0 5 x5.1 5.1 7 stop +60499 70 +1 70"), "...d..d");
    EXPECT_EQ(requests.front().processName, "caller");
    requests.front().completion("no disk");
    EXPECT_EQ(device.log.count("Error creating draft - no disk"), 1U);

    // Without a period, a run still has one draft; each message of interest moves the time on.
    prefer("TalvixInvalidXyBackOffSeconds", 0);
    EXPECT_EQ(drafts("0 drop +1000 6 +1000 6"), ".d.");
    EXPECT_EQ(device.preferences.copyPreferenceValue("TalvixInvalidXyQLTlastRun", kDomain),
              Value(device.clock.seconds()));
    EXPECT_EQ(requests.back().processName, "");
}

TEST_F(CaptureWorkersTest, TheBeginningOfABackOffIsStoredBeforeTheDraftAndTheDraftMadeBeforeTheReply) {
    const auto other = makeSession();
    std::string seen;
    for (const auto& each : {session, other}) {
        each->start();
        for (const double after : {0.0, 6.0}) {
            each->sendMessage(messageOf({{"tvac_invalid_x", after},
                                         {"zrreporting_timestamp", device.clock.seconds() + after}}),
                              [&seen](const ReplyError*) { seen += "reply "; });
        }
        seen += each == session ? "; " : "";
    }
    EXPECT_EQ(seen, "reply ; reply reply ") << "the other session is within the period";
    const auto stored = [this] {
        return device.preferences.copyPreferenceValue("TalvixInvalidXyQLTlastRun", kDomain);
    };
    EXPECT_EQ(stored(), std::nullopt);
    device.workQueues.run("com.vandra.tamblo.reporting.blocking");
    EXPECT_EQ(stored(), Value(device.clock.seconds()));
    EXPECT_THAT(device.bugReportDrafting.requests, IsEmpty());
    device.serverQueue().runAll();
    EXPECT_THAT(device.bugReportDrafting.requests, SizeIs(1));
    EXPECT_EQ(seen, "reply ; reply reply reply ");
}

TEST_F(CaptureWorkersTest, CapturesOverloadsOfLargeBuffersAndCycles) {
    EXPECT_FALSE(isCaptured(*tryToMake<Worker>(), overload, 6, 0x08000007));
    EXPECT_FALSE(isCaptured(*tryToMake<Worker>(), overload, 5, 7));
    const struct {
        Value leastSize; ///< preferences
        Value leastCycle;
        Dictionary payload;
        bool isCaptured;
    } cases[] = {
        {0, 0, {{kSize, 511}}, false},
        {"64", 0, {{kSize, 63.9}}, false},
        {"64", 0, {{kSize, "64"}}, true},
        {std::int64_t{1} << 40, 0, {{kSize, std::int64_t{1} << 32}}, true},
        {1, 3, {{kSize, 1}, {kCycle, 2}}, false},
    };
    for (const auto& [leastSize, leastCycle, payload, isToBeCaptured] : cases) {
        prefer("io_buffer_size", leastSize);
        prefer("io_cycle", leastCycle);
        EXPECT_EQ(isCaptured(*tryToMake<Worker>(), payload), isToBeCaptured)
            << jsonText(leastSize) << jsonText(leastCycle) << jsonText(payload);
    }
}

TEST_F(CaptureWorkersTest, NamesTheApplicationAndWaitsForMoreThanTenSeconds) {
    const auto worker = tryToMake<Worker>();
    Dictionary payload = overload;
    payload.set("HostApplicationDisplayID", "com.a");
    EXPECT_TRUE(isCaptured(*worker, payload));
    device.clock.advance(10s);
    EXPECT_FALSE(isCaptured(*worker, overload));
    EXPECT_TRUE(isCaptured(*tryToMake<Worker>(), overload)) << "each worker counts for itself";
    device.clock.advance(500ms);
    EXPECT_TRUE(isCaptured(*worker, overload));
    const auto& requests = device.diagnosticCapture.requests;
    EXPECT_EQ(requests[0].payload, payload);
    EXPECT_EQ(requests[0].reason, "com.a");
    EXPECT_EQ(requests[1].reason, "(null)");
    EXPECT_THAT(device.namedNotifications.posted, IsEmpty()) << "that writes a file";
    runQueues();
    const std::string posted = "com.vandra.tamblo.dropped-stackburst";
    EXPECT_THAT(device.namedNotifications.posted, ElementsAre(posted, posted, posted));
}

TEST_F(CaptureWorkersTest, WaitsAsLongAsWantedAndTheServerQueueMayThenBlock) {
    const std::pair<Value, std::int64_t> cases[] = {
        {0.9, 0}, {1'500'000.9, 1'500'000}, {-1, 0}, {4'294'967'296.0, 4'294'967'295}, {NAN, 0}};
    for (const auto& [preference, microseconds] : cases) {
        prefer("wait_time", preference);
        const auto worker = tryToMake<Worker>();
        const WallTime before = device.clock.now();
        EXPECT_TRUE(isCaptured(*worker, overload));
        EXPECT_EQ(device.clock.now() - before, std::chrono::microseconds(microseconds));
        EXPECT_EQ(device.serverQueue().mayBlock, microseconds != 0) << microseconds;
    }
}

TEST_F(CaptureWorkersTest, AValueOfTheWrongKindIsOneErrorLineUntilItChanges) {
    const std::pair<Value, const char*> cases[] = {// one line: it is no number; two: nor is it a flag
                                                   {" -.5", ""}, {"NO", "e"}, {"", "ee"}, {Array{1}, "ee"},
                                                   {"7 x", ""},  {"NO", "e"}, {1.5, ""}};
    for (const auto& [value, levels] : cases) {
        prefer("io_cycle", value);
        prefer("enable_stackburst", value);
        device.log.clear();
        for (int reading = 0; reading < 2; ++reading) {
            EXPECT_EQ(Worker::getRunTimeDefaults(device.context(), "io_cycle"), value.integerValue());
            EXPECT_EQ(Worker::getEnableFlag(device.context(), "enable_stackburst"), value.boolValue());
        }
        EXPECT_EQ(loggedLevels(ZRReportingDPLogCategory()), levels) << jsonText(value);
    }
}

TEST_F(CaptureWorkersTest, DetectorsAskForCaptures) {
    const Played cases[] = {
        {"leaks are of every session and category, but of one type", "single issue issue both both",
         "snapshot systemsounds; snapshot haptics; "},
        {"low alarms are of sessions of alarms, of one category, type and issue",
         "alerts low low low single low low low alarms lowercase low-of-session low-error low low", ""},
        {"two leaks of haptics, over sessions; repeats count", "alerts haptic alarms haptic haptic haptic",
         "snapshot haptics; snapshot haptics; "},
        {"each stuck sound, but none of 15 seconds", "alerts sound 14 alerts sound 0 sound",
         "snapshot systemsounds; "},
        {"from the last capture on", "alerts sound 15 sound 10 sound 5 sound",
         "snapshot systemsounds; snapshot systemsounds; snapshot systemsounds; "},
        {"two low alarms are too few; over a stop, and once; not answered, nothing is cancelled",
         "alarms low low stop start low low stop", "start alarms; "},
        {"every later stop cancels again", "alarms low low low answered stop start low low low stop",
         "start alarms; cancel S-1; cancel S-1; "},
        {"a capture that failed is cancelled, too", "alarms low low low failed stop",
         "start alarms; cancel NONE_RETURNED; "},
        {"one that was refused is not", "alarms refused low low low stop", "start alarms; "},
        {"a test asks for nothing", "test low low low sound stop", ""},
    };
    const std::string filter = R"({"diagnostic_extension_parameters":)"
                               R"({"com.vandra.powerlog.systemlog.filterprocess":{"processIDs":[77,78]}}})";
    FakeBugCaptureService& captures = device.bugCapture;
    for (const auto& row : cases) {
        session.reset();
        device.restart();
        captures.accepts = true;
        captures.replies.clear();
        play(row.script);
        std::string asked;
        for (const auto& request : std::exchange(captures.requests, {})) {
            EXPECT_THAT(request.processes, ElementsAre(kClient, kOtherClient));
            EXPECT_EQ(jsonText(request.payload), request.operation == "snapshot" ? filter : "{}");
            EXPECT_EQ(request.duration, request.operation == "start" ? 60s : 0s);
            if (request.operation != "cancel") {
                const BugCaptureSignature& filed = request.signature;
                const bool isOfAlarms = filed.type == "alarms";
                EXPECT_EQ(filed.domain + filed.subTypeContext + filed.detectedProcess,
                          isOfAlarms ? "TonmetryIssueDetectorcaller" : "TonmetryJouleryUnknown");
                EXPECT_EQ(filed.subType == "Error", isOfAlarms);
            }
            asked += request.operation + " " +
                     (request.operation == "cancel" ? request.session : request.signature.type) + "; ";
        }
        EXPECT_EQ(asked, row.expected) << row.what;
    }
}

TEST_F(CaptureWorkersTest, AnswersComeOnAnyThreadAndWhenEverythingIsGone) {
    play("alarms low low low sound");
    session.reset();
    device.restart();
    play("answered answered");
    EXPECT_EQ(device.log.count("Started Zeph session for"), 2U);
    play("alarms low low low");
    device.setThreshold(LogLevel::fault); // the log's lock would keep the threads apart
    std::thread answering([this] { device.bugCapture.answer(kOpened); });
    for (int i = 0; i < 20; ++i) {
        play("stop start");
    }
    answering.join();
    session->stop();
    EXPECT_EQ(device.bugCapture.requests.back().session, "S-1");
}

} // namespace
} // namespace tamblo
