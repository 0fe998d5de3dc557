#include "base/Format.h"
#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"
#include "util/InternalBuild.h"
#include "util/LogText.h"
#include "workers/sinks/LinkmeterSummary.h"
#include "workers/sinks/ZRReportingSessionRtcWorker.h"

#include <gmock/gmock.h>

#include <chrono>
#include <cmath>
#include <optional>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using namespace std::chrono_literals;

constexpr const char* kQueue = "com.vandra.tamblo.session.linkmeter";
const std::optional<std::vector<std::string>> kFound{{"one", "two"}};

/// Sessions of a device whose call-quality service answers, and whose worker's queue runs, when a test says
/// so.
class RtcWorkerTest : public testing::Test {
protected:
    std::shared_ptr<ZRReportingSession> makeSession(AudioServiceType type, Dictionary configuration = {}) {
        auto made = ZRReportingSession::initWithID(77, {1});
        made->setServiceType(type);
        made->updateConfigurationWithContentsOfConfiguration(configuration);
        return made;
    }
    void send(Dictionary payload, std::vector<const WorkerClass*> destinations = {}) {
        const MessageRef message = messageOf(std::move(payload), 0x08000004, 1);
        message->setDestinationWorkers(std::move(destinations));
        session->sendMessage(message);
    }
    void run() { device.workQueues.run(kQueue); }
    /// The values of the key in the messages that a Linkmeter session was given: the summary's in brackets,
    /// an "s" for the session's own summary, which its stop sends.
    std::string sent(std::size_t number = 0, std::string_view key = "n") {
        std::string text;
        for (const auto& message : device.callQuality.sessions.at(number)->messages) {
            std::string value;
            const Value* found = message.payload.find(key);
            appendText(value, found != nullptr ? *found : Value("-"));
            const bool isSummary = message.category == 0xFFFF && message.type == 0xFFFF;
            text += message.type == AudioEventTypeSummary ? "s" : isSummary ? "[" + value + "]" : value;
        }
        return text;
    }
    /// What the worker has logged since the last call, debug lines aside.
    std::vector<std::string> logged() {
        std::vector<std::string> texts;
        for (const FakeLog::Line& line : device.log.lines()) {
            if (line.category == "zrri" && line.level != LogLevel::debug) {
                texts.push_back(line.text);
            }
        }
        device.log.clear();
        return texts;
    }
    /// Linkmeter sessions that somebody besides the fake holds.
    [[nodiscard]] long held() const {
        long count = 0;
        for (const auto& made : device.callQuality.sessions) {
            count += made.use_count() - 1;
        }
        return count;
    }

    FakePlatform device;
    std::shared_ptr<ZRReportingSession> session = makeSession(AudioServiceTypeTelephony);
};

TEST_F(RtcWorkerTest, DescribesTheSessionToTheService) {
    const struct {
        AudioServiceType type;
        bool isSingle;
        Dictionary configuration;
        std::string serviceName;
        bool batches;
    } cases[] = {
        {AudioServiceTypeTelephony, false, {}, "telephony_session", true},
        {AudioServiceTypeStandalone, true, {{"HostApplicationDisplayID", "Unknown"}}, "standalone", true},
        {AudioServiceTypeAPIUsage, false, {{"QVHostApplicationDisplayID", "app"}}, "apiusage_session", false},
        {AudioServiceTypeUnknown, false, {{"ClientName", "other"}, {"x", 1}}, "unknown_session", true},
    };
    for (const auto& c : cases) {
        const auto described = makeSession(c.type, c.configuration);
        described->setIsSingleMessageSession(c.isSingle);
        described->start();
        run();
        const auto& made = *device.callQuality.sessions.back();
        Dictionary info{{"ClientType", 19},          {"ClientVersion", 2.1F},
                        {"SessionID", 77},           {"BatchEvent", c.batches},
                        {"HierarchyToken", "token"}, {"ContainsRealtimeEvents", !c.batches}};
        if (const Value* name = described->configuration().find("HostApplicationDisplayID")) {
            info.set("ClientBundleID", *name);
        }
        EXPECT_EQ(jsonText(made.sessionInfo), jsonText(info));
        Dictionary user{{"ClientName", "com.vandra.tamblo"},
                        {"ZRReportingSessionID", 77},
                        {"ServiceName", c.serviceName}};
        user.merge(described->configuration());
        EXPECT_EQ(jsonText(made.userInfo), jsonText(user));
    }
    const std::size_t queues = device.workQueues.made(kQueue);
    makeSession(AudioServiceTypeTest)->start();
    EXPECT_EQ(device.workQueues.made(kQueue), queues) << "the service type \"test\" has no worker";
    EXPECT_EQ(ZRReportingSessionRtcWorker::initWithSession(makeSession(AudioServiceTypeTest)), nullptr);
    session->setServiceType(AudioServiceTypeTest);
    EXPECT_EQ(ZRReportingSessionRtcWorker(session).start(), false);
}

TEST_F(RtcWorkerTest, WhatIsHandedInWhileItSetsUpFollowsInOrderWhateverComesOfIt) {
    const std::string never = "Session never started. handleMessage";
    const std::string neverStopped = "Session never started. stop";
    const std::string none = "no backends found, this session won't get sent to the server";
    const std::string timedOut = "timed out waiting for backends";
    const std::string list = R"(list of backends ["one","two"])";
    const std::string summary = "sending rtc summary event. reporterID=77";
    const struct {
        std::chrono::milliseconds waits;
        bool isFound;
        std::vector<std::string> log;
        std::string sent;
    } cases[] = {
        {8'999ms, true, {list, "continuing with backends!", summary}, "12s[1,2]"},
        {0ms, false, {none, "failed to find backend", never, never, never, neverStopped}, ""},
        {9s, false, {none, timedOut, never, never, never, neverStopped}, ""},
        // Too late, and before what waited has run.
        {9s, true, {list, timedOut, summary}, ""},
    };
    for (const auto& c : cases) {
        session = makeSession(AudioServiceTypeTelephony);
        session->start();
        EXPECT_EQ(logged(), std::vector<std::string>());
        send({{"n", 1}});
        run();
        send({{"n", 2}});
        run();
        EXPECT_THAT(logged(), ElementsAre("waiting to find backends"));
        EXPECT_EQ(sent(device.callQuality.sessions.size() - 1), "");
        session->stop();
        run();
        device.workQueues.elapse(c.waits);
        device.callQuality.findBackends(c.isFound ? kFound : std::nullopt);
        device.workQueues.elapse(9s);
        run();
        EXPECT_EQ(logged(), c.log);
        EXPECT_EQ(sent(device.callQuality.sessions.size() - 1), c.sent);
        EXPECT_EQ(device.callQuality.sessions.back()->flushes, c.sent.empty() ? 0 : 1);
        EXPECT_EQ(device.workQueues.delayedCalls(), 0U);
    }
}

TEST_F(RtcWorkerTest, SendsAtOnceOnceStartedAndSetsUpAnewForTheNextRun) {
    session->start();
    run();
    device.callQuality.findBackends(kFound);
    run();
    (void)logged();
    const int commits = device.callQuality.commits;
    send({{"n", 1}});
    EXPECT_EQ(sent(), "");
    run();
    EXPECT_EQ(sent(), "1");
    EXPECT_EQ(device.callQuality.commits, commits + 1);
    EXPECT_THAT(device.log.texts("LinkmeterAgent"),
                ElementsAre(R"(LinkmeterAgent fake session : message {"HostApplicationDisplayID":"Unknown",)"
                            R"("audiotag":"Session_PlaybackStart","invalid_timestamp":"nil","n":1} : )"
                            R"(category 134217732 : type 1)"));
    EXPECT_EQ(device.callQuality.sessions[0]->messages[0].category, 4) << "the kind";
    device.callQuality.sendFailure = "no room";
    send({{"n", 2}});
    run();
    EXPECT_THAT(logged(), ElementsAre("error sending message no room"));
    device.callQuality.sendFailure.reset();

    // Stop, and all of the next run, before the queue gets to any of it.
    session->stop();
    send({{"n", 3}});
    session->start();
    send({{"n", 4}});
    session->stop();
    run();
    EXPECT_EQ(sent(), "1s[1,2]");
    EXPECT_EQ(sent(1), "");
    device.callQuality.findBackends(kFound);
    run();
    EXPECT_EQ(sent(1), "4s[4]");
    EXPECT_EQ(device.callQuality.sessions[0]->flushes + device.callQuality.sessions[1]->flushes, 2);
    EXPECT_EQ(held(), 0);
    EXPECT_EQ(device.workQueues.made(kQueue), 1U);
}

TEST_F(RtcWorkerTest, WithoutATokenNothingIsOpened) {
    device.callQuality.token.reset();
    session->start();
    session->stop();
    run();
    EXPECT_THAT(
        logged(),
        ElementsAre("newHierarchyTokenFromParentToken returned nil. Will skip rtc for this session. start",
                    "Session never started. handleMessage", "Session never started. stop"));
    EXPECT_THAT(device.callQuality.sessions, IsEmpty());
}

TEST_F(RtcWorkerTest, BackendsFoundTooLateTurnTheWorkerOnAndEndTheNextRunsWait) {
    session->start();
    run();
    device.workQueues.elapse(9s);
    run();
    EXPECT_EQ(held(), 0) << "the session is let go";
    device.callQuality.findBackends(kFound);
    send({{"n", 1}});
    run();
    EXPECT_EQ(sent(), "");
    EXPECT_THAT(logged(), ElementsAre("waiting to find backends", "timed out waiting for backends",
                                      R"(list of backends ["one","two"])"));
    session->stop();
    session->start();
    send({{"n", 2}});
    run();
    EXPECT_THAT(logged(), ElementsAre("sending rtc summary event. reporterID=77", "waiting to find backends",
                                      "failed to find backend", "Session never started. handleMessage"));
    EXPECT_EQ(device.workQueues.delayedCalls(), 0U);
    device.callQuality.findBackends(kFound);
    send({{"n", 3}});
    run();
    EXPECT_EQ(sent(1), "3") << "the second run's own back ends";
}

TEST_F(RtcWorkerTest, ADroppedSessionLeavesNothingBehindWhileItsWorkerWaits) {
    session->start();
    run();
    send({{"n", 1}});
    EXPECT_EQ(device.workQueues.delayedCalls(), 1U);
    (void)logged();
    session.reset();
    run();
    EXPECT_EQ(device.workQueues.delayedCalls(), 0U);
    EXPECT_EQ(held(), 0);
    device.callQuality.findBackends(kFound);
    run();
    EXPECT_EQ(sent(), "");
    EXPECT_THAT(logged(), IsEmpty());
}

TEST_F(RtcWorkerTest, AStoppedSessionIsReportedInFullAfterItWasDropped) {
    for (const bool isWaitingAtStop : {true, false}) {
        for (const bool isFound : {true, false}) {
            session = makeSession(AudioServiceTypeTelephony);
            session->start();
            if (isWaitingAtStop) {
                run();
            }
            send({{"n", 1}});
            session->stop();
            session.reset();
            run();
            device.workQueues.elapse(isFound ? 0s : 9s);
            device.callQuality.findBackends(kFound);
            run();
            EXPECT_EQ(sent(device.callQuality.sessions.size() - 1), isFound ? "1s[1]" : "");
            EXPECT_EQ(held(), 0);
            EXPECT_EQ(device.workQueues.delayedCalls(), 0U);
        }
    }
}

TEST_F(RtcWorkerTest, TheSummaryJoinsWhatWasSentOnceWhileStarted) {
    send({{"early", true}, {"n", 0}});
    session->start();
    run();
    device.callQuality.findBackends(kFound);
    send({{"volume", 3}, {"n", 1}});
    send({{"volume", 3}, {"n", 1}});
    send({{"volume", 5}, {"n", 2}}, {workerClassNamed("ZRReportingSessionEventryWorker")});
    session->stop();
    run();
    EXPECT_EQ(sent(), "1s[1,2]") << "the destinations count for the sending alone";
    const auto& summary = device.callQuality.sessions[0]->messages.back();
    EXPECT_EQ(*summary.payload.find("volume"), Value("3,5"));
    EXPECT_EQ(*summary.payload.find("ZR_Session_Summary_Event"), Value("2"));
    EXPECT_FALSE(summary.payload.contains("early"));
    EXPECT_THAT(device.log.texts("sending rtc summary event. reporterID=77 volume"),
                ElementsAre(R"(sending rtc summary event. reporterID=77 volume="3,5")"));
    session.reset();
    EXPECT_EQ(held(), 0);
}

TEST_F(RtcWorkerTest, TimestampsAreKeptOnAnInternalBuild) {
    device.deviceProperties.set("InternalBuild", true);
    forgetInternalBuild();
    session->start();
    run();
    device.callQuality.findBackends(kFound);
    send({{"zrreporting_timestamp", 4e9}});
    session->stop();
    run();
    EXPECT_EQ(sent(0, "zrreporting_timestamp"), "4000000000.0s[4000000000.0,1772366400.0]");
}

MessageRef record(Dictionary payload) {
    MessageRef made = messageOf(std::move(payload));
    made->isSessionStarted = true;
    return made;
}

TEST(LinkmeterSummaryTest, ValuesAreTextsInTheOrderOfTheMessages) {
    const std::vector<MessageRef> messages{
        record({{"a", ""}, {"b", true}, {"c", Array{1, "x"}}}),
        record({}),
        record({{"a", "x"}, {"b", 0.5F}, {"ZR_Session_Summary_Event", "mine"}}),
        record({{"a", "y,z"}, {"b", std::nan("")}, {"d", Value::date(0)}}),
        record({{"a", Dictionary{{"k", 1}}}, {"b", ~0ULL}, {"c", Value::data({})}}),
        record({{"a", "a repeat"}}),
        messageOf({{"a", "before the start"}}),
    };
    messages[5]->isRedundant = true;
    EXPECT_EQ(linkmeterSummary(messages, AudioServiceTypeUnknown),
              (Dictionary{{"a", R"(,x,y,z,{"k":1})"},
                          {"b", "true,0.5,null,18446744073709551615"},
                          {"c", R"([1,"x"],"")"},
                          {"d", R"("1970-01-01T00:00:00.000Z")"},
                          {"ZR_Session_Summary_Event", "65535,mine"}}));
}

TEST(LinkmeterSummaryTest, OfManyMessagesAndKeysTakesNoLongerThanItsValues) {
    std::vector<MessageRef> messages;
    for (int i = 0; i < 100'000; ++i) {
        messages.push_back(record({{"text", "some text that does not fit"}}));
        messages.push_back(record({{formatted("key{}", i % 20'000), i}}));
    }
    const auto start = std::chrono::steady_clock::now();
    const Dictionary summary = linkmeterSummary(messages, 2);
    EXPECT_LT(std::chrono::steady_clock::now() - start, 10s) << "quadratic growth would take minutes";
    EXPECT_EQ(summary.size(), 20'002U);
    EXPECT_EQ(summary.find("text")->stringValue().size(), 100'000U * 28 - 1);
}

} // namespace
} // namespace tamblo
