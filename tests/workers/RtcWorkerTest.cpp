#include "base/Format.h"
#include "tests/workers/WorkerTest.h"
#include "util/Log.h"
#include "workers/sinks/LinkmeterSummary.h"
#include "workers/sinks/ZRReportingSessionRtcWorker.h"

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
class RtcWorkerTest : public WorkerTest {
protected:
    RtcWorkerTest() { session = makeSession(AudioServiceTypeTelephony); }

    void sendNumber(int n, Dictionary payload = {}) {
        payload.set("n", n);
        send(std::move(payload), 0x08000004, 1);
    }
    void run() { device.workQueues.run(kQueue); }
    /// Answers the oldest configuration that waits, and lets the queue go on.
    void findBackends(bool areFound = true) {
        device.callQuality.findBackends(areFound ? kFound : std::nullopt);
        run();
    }
    /// The values of the key in the messages that a Linkmeter session was given: the summary's in brackets,
    /// an "s" for the session's own summary, which its stop sends.
    std::string sent(std::size_t number = 0, std::string_view key = "n") {
        std::string text;
        for (const auto& message : device.callQuality.sessions.at(number)->messages) {
            const Value* found = message.payload.find(key);
            const std::string value = found != nullptr ? formatted("{}", *found) : "";
            const bool isSummary = message.category == 0xFFFF && message.type == 0xFFFF;
            text += message.type == AudioEventTypeSummary ? "s" : isSummary ? "[" + value + "]" : value;
        }
        return text;
    }
    /// Linkmeter sessions that somebody besides the fake holds.
    [[nodiscard]] long held() const {
        long count = 0;
        for (const auto& made : device.callQuality.sessions) {
            count += made.use_count() - 1;
        }
        return count;
    }
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
        Dictionary info{
            {"ClientType", 19},        {"ClientVersion", 2.1F},     {"SessionID", 5},
            {"BatchEvent", c.batches}, {"HierarchyToken", "token"}, {"ContainsRealtimeEvents", !c.batches}};
        if (const Value* name = described->configuration().find("HostApplicationDisplayID")) {
            info.set("ClientBundleID", *name);
        }
        EXPECT_EQ(jsonText(made.sessionInfo), jsonText(info));
        Dictionary user{
            {"ClientName", "com.vandra.tamblo"}, {"ZRReportingSessionID", 5}, {"ServiceName", c.serviceName}};
        user.merge(described->configuration());
        EXPECT_EQ(jsonText(made.userInfo), jsonText(user));
    }
    session->setServiceType(AudioServiceTypeTest);
    EXPECT_EQ(make<ZRReportingSessionRtcWorker>()->start(), false);
}

TEST_F(RtcWorkerTest, WhatIsHandedInWhileItSetsUpFollowsInOrderWhateverComesOfIt) {
    const struct {
        std::chrono::milliseconds waits;
        bool isFound;
        const char* sent;
        const char* logged; ///< of the back ends, of the end of the wait, of what is not sent, of the stop
    } cases[] = {
        {8'999ms, true, "12s[1,2]", "sss"},
        {0ms, false, "", "esssss"},
        {9s, false, "", "esssss"},
        {9s, true, "", "sss"}, // too late, and before what waited has run
    };
    for (const auto& c : cases) {
        session = makeSession(AudioServiceTypeTelephony);
        session->start();
        sendNumber(1);
        run();
        sendNumber(2);
        run();
        EXPECT_EQ(sent(device.callQuality.sessions.size() - 1), "");
        EXPECT_EQ(loggedLevels(ZRReportingSessionLinkmeterCategory()), "s");
        session->stop();
        run();
        device.workQueues.elapse(c.waits);
        device.callQuality.findBackends(c.isFound ? kFound : std::nullopt);
        device.workQueues.elapse(9s);
        run();
        EXPECT_EQ(loggedLevels(ZRReportingSessionLinkmeterCategory()), c.logged);
        EXPECT_EQ(sent(device.callQuality.sessions.size() - 1), c.sent);
        EXPECT_EQ(device.callQuality.sessions.back()->flushes, *c.sent != '\0' ? 1 : 0);
        EXPECT_EQ(device.workQueues.delayedCalls(), 0U);
    }
}

TEST_F(RtcWorkerTest, SendsAtOnceOnceStartedAndSetsUpAnewForTheNextRun) {
    session->start();
    run();
    findBackends();
    const int commits = device.callQuality.commits;
    sendNumber(1);
    EXPECT_EQ(sent(), "");
    run();
    EXPECT_EQ(sent(), "1");
    EXPECT_EQ(device.callQuality.commits, commits + 1);
    EXPECT_EQ(device.callQuality.sessions[0]->messages[0].category, 4) << "the kind";
    device.callQuality.sendFailure = "no room";
    (void)logged(ZRReportingSessionLinkmeterCategory());
    sendNumber(2);
    run();
    EXPECT_EQ(loggedLevels(ZRReportingSessionLinkmeterCategory()), "e");
    device.callQuality.sendFailure.reset();

    // Stop, and all of the next run, before the queue gets to any of it.
    session->stop();
    sendNumber(3);
    session->start();
    sendNumber(4);
    session->stop();
    run();
    EXPECT_EQ(sent(), "1s[1,2]");
    EXPECT_EQ(sent(1), "");
    findBackends();
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
    EXPECT_EQ(loggedLevels(ZRReportingSessionLinkmeterCategory()), "ess");
    EXPECT_THAT(device.callQuality.sessions, IsEmpty());
}

TEST_F(RtcWorkerTest, BackendsFoundTooLateTurnTheWorkerOnAndEndTheNextRunsWait) {
    session->start();
    run();
    device.workQueues.elapse(9s);
    run();
    EXPECT_EQ(held(), 0) << "the session is let go";
    findBackends();
    sendNumber(1);
    run();
    EXPECT_EQ(sent(), "");
    session->stop();
    session->start();
    sendNumber(2);
    run();
    EXPECT_EQ(device.workQueues.delayedCalls(), 0U) << "does not wait, and is not started";
    EXPECT_EQ(sent(1), "");
    findBackends();
    sendNumber(3);
    run();
    EXPECT_EQ(sent(1), "3") << "the second run's own back ends";
}

TEST_F(RtcWorkerTest, ADroppedSessionLeavesNothingBehindWhileItsWorkerWaits) {
    session->start();
    run();
    sendNumber(1);
    EXPECT_EQ(device.workQueues.delayedCalls(), 1U);
    session.reset();
    run();
    EXPECT_EQ(device.workQueues.delayedCalls(), 0U);
    EXPECT_EQ(held(), 0);
    device.log.clear();
    findBackends();
    EXPECT_EQ(sent(), "");
    EXPECT_THAT(device.log.lines(), IsEmpty());
}

TEST_F(RtcWorkerTest, AStoppedSessionIsReportedInFullAfterItWasDropped) {
    for (const bool isWaitingAtStop : {true, false}) {
        for (const bool isFound : {true, false}) {
            session = makeSession(AudioServiceTypeTelephony);
            session->start();
            if (isWaitingAtStop) {
                run();
            }
            sendNumber(1);
            session->stop();
            session.reset();
            run();
            device.workQueues.elapse(isFound ? 0s : 9s);
            findBackends();
            EXPECT_EQ(sent(device.callQuality.sessions.size() - 1), isFound ? "1s[1]" : "");
            EXPECT_EQ(held(), 0);
            EXPECT_EQ(device.workQueues.delayedCalls(), 0U);
        }
    }
}

TEST_F(RtcWorkerTest, TheSummaryJoinsWhatWasSentOnceWhileStarted) {
    sendNumber(0, {{"early", true}});
    session->start();
    run();
    findBackends();
    sendNumber(1, {{"volume", 3}, {"zrreporting_timestamp", 4e9}});
    sendNumber(1, {{"volume", 3}, {"zrreporting_timestamp", 4e9}});
    const MessageRef elsewhere =
        messageOf({{"volume", 5}, {"n", 2}, {"zrreporting_timestamp", 5e9}}, 0x08000004, 1);
    elsewhere->setDestinationWorkers({workerClassNamed("ZRReportingSessionEventryWorker")});
    session->sendMessage(elsewhere);
    session->stop();
    run();
    EXPECT_EQ(sent(), "1s[1,2]") << "the destinations count for the sending alone";
    EXPECT_EQ(sent(0, "zrreporting_timestamp"), "s[]") << "outside internal builds";
    const auto& summary = device.callQuality.sessions[0]->messages.back();
    EXPECT_EQ(*summary.payload.find("volume"), Value("3,5"));
    EXPECT_EQ(*summary.payload.find("ZR_Session_Summary_Event"), Value("2"));
    EXPECT_FALSE(summary.payload.contains("early"));
    setInternalBuild(true);
    session = makeSession(AudioServiceTypeTelephony);
    session->start();
    run();
    findBackends();
    sendNumber(3, {{"zrreporting_timestamp", 4e9}});
    run();
    EXPECT_EQ(sent(1, "zrreporting_timestamp"), "4000000000.0");
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
