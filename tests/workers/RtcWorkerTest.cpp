#include "base/Format.h"
#include "tests/workers/WorkerTest.h"
#include "workers/sinks/LinkmeterSummary.h"
#include "workers/sinks/ZRReportingSessionRtcWorker.h"

#include <algorithm>

namespace tamblo {
namespace {

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
                   {"run", [this] { device.workQueues.run("com.vandra.tamblo.session.linkmeter"); }},
                   {"found",
                    [this] {
                        device.callQuality.findBackends({{"one", "two"}});
                    }},
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
        return text + std::to_string(device.workQueues.delayedCalls()) +
               std::string(static_cast<std::size_t>(std::ranges::count(levels, 'e')), 'e');
    }
};

TEST_F(RtcWorkerTest, DescribesTheSessionToTheService) {
    session = makeSession(AudioServiceTypeTelephony,
                          {{"ClientName", "other"}, {"HostApplicationDisplayID", "app"}, {"x", 1}});
    session->setIsSingleMessageSession(true);
    play("start run");
    const auto& made = *device.callQuality.sessions.back();
    EXPECT_EQ(jsonText(made.sessionInfo) + jsonText(made.userInfo),
              R"({"BatchEvent":true,"ClientBundleID":"app","ClientType":19,"ClientVersion":2.1,)"
              R"("ContainsRealtimeEvents":false,"HierarchyToken":"token","SessionID":5})"
              R"({"ClientName":"other","HostApplicationDisplayID":"app","ServiceName":"telephony",)"
              R"("ZRReportingSessionID":5,"x":1})");
    session->setServiceType(AudioServiceTypeTest);
    EXPECT_EQ(make<ZRReportingSessionRtcWorker>()->start(), false);
}

TEST_F(RtcWorkerTest, SetsUpThenSendsInOrderWhateverComesOfIt) {
    const Played cases[] = {
        {"what is handed in meanwhile follows", "start 1 run 2 run", "+/1"},
        {"back ends at the last moment", "start 1 run 2 run stop run 8999ms found 9000ms run", "12s[1,2]f/0"},
        {"no back ends", "start 1 run 2 run stop run none run", "+/0e"},
        {"none, and too late", "start 1 run 2 run stop run 9000ms none run", "/0e"},
        {"found too late, before what waited has run", "start 1 run stop run 9000ms found run", "/0"},
        {"one that cannot be sent", "start run found run fails 1 run works 2 run", "2+/0e"},
        {"two runs before the queue gets to them", "start run found 1 stop 2 start 3 stop run", "1s[1]f/+/1"},
        {"each set up anew", "start run found 1 stop 2 start 3 stop run found run", "1s[1]f/3s[3]f/0"},
        {"found after it: on, without a session", "start run 9000ms run found 1 run", "/0"},
        {"the next run is not on", "start run 9000ms run found stop start 1 run", "/+/0"},
        {"until its own are found", "start run 9000ms run found stop start run found 1 run", "/1+/0"},
        {"a dropped session leaves nothing", "start run 1 drop run found run", "/0"},
        {"nor before it waits", "start 1 drop run found run", "/0"},
        {"when nothing waits, all is sent", "start run found run 1 drop run", "1/0"},
        {"a stopped one is reported in full", "start run 1 stop drop run found run", "1s[1]f/0"},
        {"or when the wait is over", "start run 1 stop drop run 9000ms run", "/0"},
        {"whenever it was dropped", "start 1 stop drop run found run", "1s[1]f/0"},
    };
    for (const auto& row : cases) {
        device.callQuality.sessions.clear();
        device.callQuality.completions.clear();
        session = makeSession(AudioServiceTypeTelephony);
        device.log.clear();
        play(row.script);
        EXPECT_EQ(outcome(), row.expected) << row.what;
        play("drop 9000ms run");
    }
    device.callQuality.token.reset();
    session = makeSession(AudioServiceTypeTelephony);
    device.callQuality.sessions.clear();
    play("start 1 stop run");
    EXPECT_EQ(outcome(), "0e") << "without a token nothing is opened";
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
    setInternalBuild(true);
    session = makeSession(AudioServiceTypeTelephony);
    play("start run found");
    sendNumber(3, {{"zrreporting_timestamp", 4e9}});
    play("run");
    EXPECT_EQ(sent(*sessions[1], "zrreporting_timestamp"), "4000000000.0");
}

TEST(LinkmeterSummaryTest, ValuesAreTextsInTheOrderOfTheMessages) {
    const auto messages = messagesOf({{{"a", ""}, {"b", true}, {"c", Array{1, "x"}}},
                                      {{"a", "x"}, {"b", 0.5F}, {"ZR_Session_Summary_Event", "mine"}},
                                      {{"a", "y,z"}, {"b", NAN}, {"d", Value::date(0)}},
                                      {{"a", Dictionary{{"k", 1}}}, {"b", ~0ULL}, {"c", Value::data({})}},
                                      {{"a", "a repeat"}},
                                      {{"a", "before the start"}}});
    for (const MessageRef& message : messages) {
        message->isSessionStarted = message != messages.back();
    }
    messages[4]->isRedundant = true;
    EXPECT_EQ(linkmeterSummary(messages, AudioServiceTypeUnknown),
              (Dictionary{{"a", R"(,x,y,z,{"k":1})"},
                          {"b", "true,0.5,null,18446744073709551615"},
                          {"c", R"([1,"x"],"")"},
                          {"d", R"("1970-01-01T00:00:00.000Z")"},
                          {"ZR_Session_Summary_Event", "65535,mine"}}));
}

} // namespace
} // namespace tamblo
