#include "base/Format.h"
#include "tests/workers/WorkerTest.h"
#include "util/Log.h"
#include "workers/sinks/LinkmeterSummary.h"
#include "workers/sinks/ZRReportingSessionRtcWorker.h"

#include <cmath>
#include <optional>
#include <sstream>

namespace tamblo {
namespace {

using namespace std::chrono_literals;

constexpr const char* kQueue = "com.vandra.tamblo.session.linkmeter";

/// Sessions of a device whose call-quality service answers, and whose worker's queue runs, when a test says
/// so.
class RtcWorkerTest : public WorkerTest {
protected:
    RtcWorkerTest() { session = makeSession(AudioServiceTypeTelephony); }

    void sendNumber(int n, Dictionary payload = {}) {
        payload.set("n", n);
        send(std::move(payload), 0x08000004, 1);
    }
    void run() { device.workQueues.run(kQueue); }
    /// Answers the oldest configuration that waits.
    void findBackends(bool areFound = true) {
        device.callQuality.findBackends(areFound ? std::optional<std::vector<std::string>>({"one", "two"})
                                                 : std::nullopt);
    }
    /// Does what the words say; a number is sent as a message, or is a time in milliseconds.
    void play(const std::string& script) {
        std::istringstream words(script);
        for (std::string word; words >> word;) {
            if (word == "start") {
                session->start();
            } else if (word == "stop") {
                session->stop();
            } else if (word == "drop") {
                session.reset();
            } else if (word == "run") {
                run();
            } else if (word == "found" || word == "none") {
                findBackends(word == "found");
            } else if (word == "fails") {
                device.callQuality.sendFailure = "no room";
            } else if (word == "works") {
                device.callQuality.sendFailure.reset();
            } else if (word.ends_with("ms")) {
                device.workQueues.elapse(std::chrono::milliseconds(std::stoi(word)));
            } else {
                sendNumber(std::stoi(word));
            }
        }
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
    /// What all Linkmeter sessions were sent, with a "+" for each that somebody besides the fake holds, and
    /// how many waits there are.
    std::string outcome() {
        std::string text;
        for (const auto& made : device.callQuality.sessions) {
            text += sent(*made) + (made.use_count() > 1 ? "+" : "") + "/";
        }
        return text + std::to_string(device.workQueues.delayedCalls());
    }
};

TEST_F(RtcWorkerTest, DescribesTheSessionToTheService) {
    const auto described = [this](AudioServiceType type, const Dictionary& configuration, bool isSingle) {
        session = makeSession(type, configuration);
        session->setIsSingleMessageSession(isSingle);
        session->start();
        run();
        const auto& made = *device.callQuality.sessions.back();
        return jsonText(made.sessionInfo) + jsonText(made.userInfo);
    };
    const std::string rest = R"("ClientType":19,"ClientVersion":2.1,"ContainsRealtimeEvents":)";
    const std::string ids = R"(,"HierarchyToken":"token","SessionID":5})";
    EXPECT_EQ(
        described(AudioServiceTypeTelephony, {{"ClientName", "other"}, {"x", 1}}, false),
        R"({"BatchEvent":true,)" + rest + "false" + ids +
            R"({"ClientName":"other","ServiceName":"telephony_session","ZRReportingSessionID":5,"x":1})");
    EXPECT_EQ(described(AudioServiceTypeAPIUsage, {{"HostApplicationDisplayID", "app"}}, true),
              R"({"BatchEvent":false,"ClientBundleID":"app",)" + rest + "true" + ids +
                  R"({"ClientName":"com.vandra.tamblo","HostApplicationDisplayID":"app",)"
                  R"("ServiceName":"apiusage","ZRReportingSessionID":5})");
    session->setServiceType(AudioServiceTypeTest);
    EXPECT_EQ(make<ZRReportingSessionRtcWorker>()->start(), false);
}

TEST_F(RtcWorkerTest, SetsUpThenSendsInOrderWhateverComesOfIt) {
    const struct {
        const char* what;
        const char* script;
        const char* outcome;
        const char* logged; ///< levels, from standard on
    } cases[] = {
        {"what is handed in meanwhile follows", "start 1 run 2 run", "+/1", "s"},
        {"back ends at the last moment", "start 1 run 2 run stop run 8999ms found 9000ms run", "12s[1,2]f/0",
         "ssss"},
        {"no back ends", "start 1 run 2 run stop run none run", "+/0", "sesssss"},
        {"none, and too late", "start 1 run 2 run stop run 9000ms none run", "/0", "sesssss"},
        {"found too late, but before what waited has run", "start 1 run stop run 9000ms found run", "/0",
         "ssss"},
        {"a message is sent at once", "start run found run 1 run", "1+/0", "sss"},
        {"one that cannot be sent", "start run found run fails 1 run works 2 run", "2+/0", "ssse"},
        {"two runs before the queue gets to them", "start run found 1 stop 2 start 3 stop run", "1s[1]f/+/1",
         "sssss"},
        {"the second is set up anew", "start run found 1 stop 2 start 3 stop run found run",
         "1s[1]f/3s[3]f/0", "ssssssss"},
        {"a time-out lets the session go", "start run 9000ms run", "/0", "ss"},
        {"found after it: on, without a session", "start run 9000ms run found 1 run", "/0", "sss"},
        {"and the next run does not wait, nor is on", "start run 9000ms run found stop start 1 run", "/+/0",
         "sssssss"},
        {"until its own are found", "start run 9000ms run found stop start run found 1 run", "/1+/0",
         "sssssss"},
        {"a dropped session leaves nothing", "start run 1 drop run found run", "/0", "s"},
        {"nor before it waits", "start 1 drop run found run", "/0", "s"},
        {"when nothing waits, all is sent", "start run found run 1 drop run", "1/0", "sss"},
        {"a stopped one is reported in full", "start run 1 stop drop run found run", "1s[1]f/0", "ssss"},
        {"or when the wait is over", "start run 1 stop drop run 9000ms run", "/0", "sssss"},
        {"whenever it was dropped", "start 1 stop drop run found run", "1s[1]f/0", "ssss"},
    };
    for (const auto& row : cases) {
        device.callQuality.sessions.clear();
        device.callQuality.completions.clear();
        session = makeSession(AudioServiceTypeTelephony);
        (void)logged(ZRReportingSessionLinkmeterCategory());
        play(row.script);
        EXPECT_EQ(outcome(), row.outcome) << row.what;
        EXPECT_EQ(loggedLevels(ZRReportingSessionLinkmeterCategory()), row.logged) << row.what;
        session.reset();
        device.workQueues.elapse(9s);
        run();
    }
    device.callQuality.token.reset();
    session = makeSession(AudioServiceTypeTelephony);
    device.callQuality.sessions.clear();
    play("start 1 stop run");
    EXPECT_EQ(outcome(), "0") << "without a token nothing is opened";
}

TEST_F(RtcWorkerTest, TheSummaryJoinsWhatWasSentOnceWhileStarted) {
    const auto& sessions = device.callQuality.sessions;
    sendNumber(0, {{"early", true}});
    play("start run found");
    sendNumber(1, {{"volume", 3}, {"zrreporting_timestamp", 4e9}});
    run();
    EXPECT_EQ(sessions[0]->messages[0].category, 4) << "the kind";
    sendNumber(1, {{"volume", 3}, {"zrreporting_timestamp", 4e9}});
    const MessageRef elsewhere = messageOf({{"volume", 5}, {"n", 2}, {"zrreporting_timestamp", 5e9}}, 4, 1);
    elsewhere->setDestinationWorkers({workerClassNamed("ZRReportingSessionEventryWorker")});
    session->sendMessage(elsewhere);
    play("stop run");
    EXPECT_EQ(outcome(), "1s[1,2]f/0") << "the destinations count for the sending alone";
    EXPECT_EQ(sent(*sessions[0], "zrreporting_timestamp"), "s[]f") << "outside internal builds";
    EXPECT_EQ(sent(*sessions[0], "volume"), "3s[3,5]f");
    EXPECT_EQ(shown(sessions[0]->messages.back().payload, {"ZR_Session_Summary_Event", "early"}), "\"2\"");
    setInternalBuild(true);
    session = makeSession(AudioServiceTypeTelephony);
    play("start run found");
    sendNumber(3, {{"zrreporting_timestamp", 4e9}});
    run();
    EXPECT_EQ(sent(*sessions[1], "zrreporting_timestamp"), "4000000000.0");
}

TEST(LinkmeterSummaryTest, ValuesAreTextsInTheOrderOfTheMessages) {
    const auto messages = messagesOf({
        {{"a", ""}, {"b", true}, {"c", Array{1, "x"}}},
        {},
        {{"a", "x"}, {"b", 0.5F}, {"ZR_Session_Summary_Event", "mine"}},
        {{"a", "y,z"}, {"b", std::nan("")}, {"d", Value::date(0)}},
        {{"a", Dictionary{{"k", 1}}}, {"b", ~0ULL}, {"c", Value::data({})}},
        {{"a", "a repeat"}},
        {{"a", "before the start"}},
    });
    for (const MessageRef& message : messages) {
        message->isSessionStarted = message != messages.back();
    }
    messages[5]->isRedundant = true;
    EXPECT_EQ(linkmeterSummary(messages, AudioServiceTypeUnknown),
              (Dictionary{{"a", R"(,x,y,z,{"k":1})"},
                          {"b", "true,0.5,null,18446744073709551615"},
                          {"c", R"([1,"x"],"")"},
                          {"d", R"("1970-01-01T00:00:00.000Z")"},
                          {"ZR_Session_Summary_Event", "65535,mine"}}));
}

} // namespace
} // namespace tamblo
