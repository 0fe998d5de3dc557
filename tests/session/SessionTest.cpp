#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"
#include "tests/session/ScriptedWorkers.h"

#include <gmock/gmock.h>

namespace tamblo {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;

class SessionTest : public testing::Test {
protected:
    SessionTest() { script.reset(); }
    ~SessionTest() override { script.reset(); }

    std::shared_ptr<ZRReportingSession> makeSession() {
        auto session = device.makeSession(77, {42});
        (void)script.take();
        return session;
    }
    static MessageRef send(ZRReportingSession& session, Dictionary payload,
                           AudioEventCategory category = AudioEventKindVolume,
                           AudioEventType type = AudioEventTypeSummary) {
        MessageRef message = messageOf(std::move(payload), category, type);
        session.sendMessage(message);
        return message;
    }

    FakePlatform device;
    WorkerScript& script = WorkerScript::current();
};

TEST_F(SessionTest, WorkersStartAndStopInOrder) {
    const auto session = device.makeSession(77, {42});
    EXPECT_THAT(script.take(), ElementsAre("start Init"));
    EXPECT_EQ(session->workerInstanceCount(), 2U);
    EXPECT_FALSE(session->started());

    session->start();
    EXPECT_THAT(script.take(), ElementsAre("start Both", "start Late", "start Producer"));
    EXPECT_EQ(session->workerInstanceCount(), 6U);
    session->stop();
    EXPECT_THAT(script.take(), ElementsAre("stop Producer", "stop Both", "stop Init", "stop Redundant",
                                           "stop Late", "stop Only"));
    session->start();
    EXPECT_EQ(session->workerInstanceCount(), 6U) << "stopped workers are used again";
    EXPECT_THAT(script.take(), ElementsAre("start Init", "start Both", "start Late", "start Producer"));
}

TEST_F(SessionTest, AWorkerThatRefusesIsTriedAgainAndOneThatDoesNotStartGetsNothing) {
    script.refusing = {"Late"};
    script.notStarting = {"Both"};
    const auto session = makeSession();
    session->start();
    EXPECT_EQ(session->workerInstanceCount(), 5U);
    send(*session, {{"a", 1}});
    EXPECT_EQ(script.count("message Both 14/11"), 0U);
    EXPECT_EQ(script.count("start Both"), 1U) << "once, though it stands in three lists";
    session->stop();
    EXPECT_EQ(script.count("stop Both"), 0U);

    script.refusing.clear();
    script.notStarting.clear();
    (void)script.take();
    session->start();
    EXPECT_EQ(session->workerInstanceCount(), 6U);
    send(*session, {{"a", 1}});
    EXPECT_EQ(script.count("message Late 14/11"), 1U);
    EXPECT_EQ(script.count("message Both 14/11"), 1U);
}

TEST_F(SessionTest, ASingleMessageSessionLeavesOutTheWorkersThatAreNotForIt) {
    const auto session = makeSession();
    session->setIsSingleMessageSession(true);
    session->start();
    EXPECT_THAT(script.take(), ElementsAre("start Late"));
    EXPECT_EQ(session->workerInstanceCount(), 3U) << "Redundant was made before the session was such a one";
    EXPECT_THAT(workerClassLists().valid, testing::Not(Contains(workerClassNamed("Absent"))));
}

TEST_F(SessionTest, MessagesReachTheConsumersThatMaySeeThem) {
    const auto session = makeSession();
    EXPECT_FALSE(send(*session, {{"a", 0}})->isSessionStarted);
    EXPECT_THAT(script.take(), ElementsAre("message Init 14/11", "message Redundant 14/11"));
    session->start();
    (void)script.take();

    EXPECT_TRUE(send(*session, {{"a", 1}})->isSessionStarted);
    EXPECT_THAT(script.take(), ElementsAre("message Init 14/11", "message Redundant 14/11",
                                           "message Both 14/11", "message Late 14/11"));
    EXPECT_TRUE(send(*session, {{"a", 1}})->isRedundant);
    EXPECT_THAT(script.take(), ElementsAre("message Redundant 14/11"));

    const MessageRef message = messageOf({{"a", 2}}, 5, 6);
    message->setDestinationWorkers({workerClassNamed("Late"), workerClassNamed("Producer")});
    bool isAnswered = false;
    session->sendMessage(message, [&](const ReplyError* error) { isAnswered = error == nullptr; });
    EXPECT_THAT(script.take(), ElementsAre("message Late 5/6"));
    EXPECT_TRUE(isAnswered);
    EXPECT_TRUE(message->copyWithZone()->destinationWorkers().empty());
}

TEST_F(SessionTest, CountsAndPreviousValuesFollowEveryMessageTheListOnlyTheAccepted) {
    const auto session = makeSession();
    session->start();
    send(*session, {{"a", 1}, {"b", 1}});
    send(*session, {{"a", 1}, {"b", 1}, {"systemuptime_sec", 9}});
    EXPECT_EQ(session->totalMessageCount(), 2);
    EXPECT_EQ(session->messages().size(), 2U) << "the start's own and the first";
    EXPECT_EQ(session->previousValues().find("systemuptime_sec")->integerValue(), 9);
    send(*session, {{"a", 2}});
    EXPECT_EQ(session->previousValues().find("a")->integerValue(), 2);
    EXPECT_EQ(session->previousValues().find("b")->integerValue(), 1);
    session->stop();
    EXPECT_EQ(session->totalMessageCount(), 0);
    EXPECT_THAT(session->messages(), IsEmpty());
    EXPECT_TRUE(session->previousValues().contains("b"));
}

TEST_F(SessionTest, OwnRecordsOfStartAndStop) {
    const auto session = makeSession();
    session->stop();
    ASSERT_EQ(session->messages().size(), 1U) << "a stop without a start stays until the next real one";
    session->start();
    session->start();
    ASSERT_EQ(session->messages().size(), 3U);
    EXPECT_EQ(device.log.count("77 is already started"), 1U);
    const double now = device.clock.seconds();
    const auto expected = [now](const char* method, int count, const char* running) {
        const std::string at = std::string("_at_") + method;
        return Dictionary{
            {"method", method},
            {"messages" + at, count},
            {"unique_messages" + at, count},
            {"reporterid", 77},
            {"running" + at, running},
            {"zrreporting_timestamp", now},
            {"invalid_timestamp", "nil"},
            {"audiotag", std::string("Setup") + (*method == 's' && method[2] == 'a' ? "Start" : "Stop")}};
    };
    EXPECT_EQ(session->messages()[0]->payload(), expected("stop", 0, "NO"));
    EXPECT_EQ(session->messages()[1]->payload(), expected("start", 1, "NO"));
    EXPECT_EQ(session->messages()[2]->payload(), expected("start", 2, "YES"));
    EXPECT_EQ(session->messages()[2]->category(), AudioEventKindSetup);

    // They are what a client's message of their kind is compared with.
    const auto isRepeat = [&] {
        return send(*session, {{"a", 1}}, AudioEventKindSetup, AudioEventTypeStart)->isRedundant;
    };
    EXPECT_FALSE(isRepeat());
    EXPECT_TRUE(isRepeat());
    session->start();
    EXPECT_FALSE(isRepeat()) << "the start's own record lies between";
}

TEST_F(SessionTest, ProducersSendWhileConsumersStillRun) {
    const auto session = makeSession();
    std::vector<std::int64_t> seen;
    script.atStop["Producer"] = [&seen](ZRReportingSession& owner) {
        for (const MessageRef& message : owner.messages()) {
            const Value* number = message->payload().find("n");
            seen.push_back(number != nullptr ? number->integerValue() : 0);
        }
        EXPECT_TRUE(send(owner, {{"sum", 1}}, 1, 11)->isSessionStarted);
    };
    script.atStop["Late"] = [](ZRReportingSession& owner) { send(owner, {{"late", 1}}, 2, 11); };
    session->start();
    const double now = device.clock.seconds();
    send(*session, {{"n", 2}, {"zrreporting_timestamp", now + 2}});
    send(*session, {{"n", 1}, {"zrreporting_timestamp", now + 1}});
    (void)script.take();
    session->stop();
    EXPECT_THAT(seen, ElementsAre(0, 0, 1, 2)) << "the session's own records, then by time";
    EXPECT_THAT(script.take(), ElementsAre("stop Producer", "message Init 1/11", "message Redundant 1/11",
                                           "message Both 1/11", "message Late 1/11", "stop Both", "stop Init",
                                           "stop Redundant", "stop Late", "message Late 2/11", "stop Only"));
    EXPECT_THAT(session->messages(), IsEmpty());
}

TEST_F(SessionTest, ConfigurationIsAddedToAndNamesTheApplication) {
    const auto session = makeSession();
    const auto appName = [&] {
        return send(*session, {{"x", 1}})->payload().find("HostApplicationDisplayID");
    };
    EXPECT_EQ(appName()->stringValue(), "Unknown");
    session->updateConfigurationWithContentsOfConfiguration(
        {{"QVHostApplicationDisplayID", "com.qv"}, {"k", 1}});
    EXPECT_EQ(appName()->stringValue(), "com.qv");
    session->updateConfigurationWithContentsOfConfiguration(
        {{"QVHostApplicationDisplayID", "com.qv2"}, {"HostApplicationDisplayID", "com.host"}});
    EXPECT_EQ(appName()->stringValue(), "com.host");
    session->updateConfigurationWithContentsOfConfiguration({});
    EXPECT_TRUE(session->configuration().contains("k"));
    session->setServiceType(AudioServiceTypeTelephony);
    EXPECT_EQ(session->description(),
              "reporterID=77,serviceName=telephony,ownerPid=42,clientProcessName=(null),"
              "HostApplicationDisplayID=com.host,started=0,singleMessageSession=0");
}

TEST_F(SessionTest, TracePointsAndLinesOfALife) {
    (void)device.tracePoints.take();
    auto session = makeSession();
    session->start();
    send(*session, {{"a", 1}});
    send(*session, {{"a", 1}});
    session->stop();
    session.reset();
    EXPECT_THAT(device.tracePoints.take(),
                ElementsAre(0x21044828, 0x2104482C, 0x21044838, 0x21044838, 0x21044830, 0x21044834));
    const std::pair<LogLevel, std::string> expected[] = {
        {LogLevel::info, "created reporting session for ID: 77"},
        {LogLevel::debug, "self.started==false. starting. reporterID=77"},
        {LogLevel::debug, "ending session. reporterID=77"},
        {LogLevel::info, "deallocing this session 77"}};
    for (const auto& [level, text] : expected) {
        EXPECT_THAT(device.log.lines(),
                    Contains(testing::AllOf(testing::Field(&FakeLog::Line::level, level),
                                            testing::Field(&FakeLog::Line::text, text),
                                            testing::Field(&FakeLog::Line::category, "zrrr"))));
    }
    EXPECT_EQ(
        device.log.count("ZRReportingSessionWorker action=sendMessage reporterID=77 app=Unknown redundant=NO "
                         "message={\"HostApplicationDisplayID\":\"Unknown\",\"a\":1"),
        1U);
}

} // namespace
} // namespace tamblo
