#include "tests/service_core/ServiceTestBase.h"

#include <random>

namespace tamblo {
namespace {

using std::chrono::milliseconds;
using testing::ElementsAre;
using testing::IsEmpty;

using ServiceTest = ServiceTestBase;

TEST_F(ServiceTest, FindsSessionsByID) {
    const Connection first = connect(10);
    const Connection second = connect(11);
    open(second, 7);
    open(second, 8);
    EXPECT_THAT(found({7, 0, 7, 8}), ElementsAre(7, 7, 8));
    EXPECT_THAT(found({0}), IsEmpty()) << "no falling back when IDs were given";
    EXPECT_THAT(found({9}), IsEmpty());
    EXPECT_EQ(service->singleMessageSession(), nullptr);

    open(first, 7);
    EXPECT_EQ(find(7)->processIdentifiers().front(), 10) << "the client that was accepted first wins";
    first->interrupt();
    (void)run();
    EXPECT_EQ(find(7)->processIdentifiers().front(), 11);
}

TEST_F(ServiceTest, TheRegistryFindsWhatAWalkOverTheClientsWould) {
    std::mt19937 random(11);
    const auto upTo = [&](unsigned most) { return random() % (most + 1); };
    std::vector<Connection> connections;
    for (int step = 0; step < 3000; ++step) {
        if (connections.empty() || (connections.size() < 6 && upTo(30) == 0)) {
            connections.push_back(connect(100 + step));
        }
        const std::size_t at = upTo(static_cast<unsigned>(connections.size() - 1));
        ZRReportingServiceProtocol& client = connections[at]->object();
        const ReporterID id = upTo(4) + 1;
        const auto what = upTo(12);
        if (what == 0) {
            connections[at]->invalidate();
            connections.erase(connections.begin() + static_cast<int>(at));
        } else if (what == 1) {
            client.destroyReportingSession(id, {});
        } else if (what == 2) {
            client.setServiceType(static_cast<std::uint16_t>(upTo(3)), id, {});
        } else if (what < 5) {
            client.stopReportingSessionForID(id, {});
        } else if (what < 8) {
            client.startReportingSessionForID(id, {});
        } else {
            client.createReportingSession(id, {});
        }
        (void)run();
        std::vector<SessionRef> active;
        for (const ClientRef& each : service->getAllClients()) {
            for (const auto& [key, session] : each->clientReportingSessionMap()) {
                if (session->started()) {
                    active.push_back(session);
                }
            }
        }
        ASSERT_EQ(service->getAllActiveReportingSessions(), active) << step;
        for (ReporterID each = 1; each <= 5; ++each) {
            SessionRef first;
            for (const ClientRef& holder : service->getAllClients()) {
                first = first != nullptr ? first : holder->findReportingSessionForID(each, false);
            }
            ASSERT_EQ(find(each), first) << step;
        }
        device.log.clear();
    }
}

TEST_F(ServiceTest, MessagesWithoutIDsGoToEveryStartedSession) {
    const Connection first = connect(10);
    const Connection second = connect(11);
    open(first, 7);
    open(second, 8);
    second->object().createReportingSession(9, {});
    (void)run();
    EXPECT_THAT(found({}), ElementsAre(7, 8));
    send(first, {}, {{"to", "both"}});
    const Dictionary& sent = find(7)->messages().back()->payload();
    EXPECT_EQ(sent, find(8)->messages().back()->payload());
    EXPECT_TRUE(sent.contains("to"));
    EXPECT_FALSE(sent.contains("sendSingleMessage"));
    EXPECT_EQ(service->singleMessageSession(), nullptr);
}

TEST_F(ServiceTest, TheSingleMessageSessionLivesUntilItIsIdleForMoreThanFiveSeconds) {
    const Connection client = connect(10);
    send(client, {});
    const SessionRef session = service->singleMessageSession();
    ASSERT_NE(session, nullptr);
    EXPECT_EQ(session->description(),
              "reporterID=1,serviceName=standalone,ownerPid=4321,clientProcessName=(null),"
              "HostApplicationDisplayID=Unknown,started=1,singleMessageSession=1");
    EXPECT_EQ(session->messages().back()->payload().find("a")->integerValue(), 1);
    EXPECT_EQ(find(1), nullptr) << "it cannot be had by its ID";

    device.clock.advance(milliseconds(4000));
    send(client, {});
    EXPECT_EQ(service->singleMessageSession(), session);
    device.clock.advance(milliseconds(5000));
    device.clock.set(device.clock.now() - std::chrono::hours(24)); // it is the steady time that counts
    (void)device.serverQueue().takePaces();
    device.workQueues.elapse(milliseconds(499));
    EXPECT_EQ(run(), 0U);
    device.workQueues.elapse(milliseconds(1));
    EXPECT_THAT(device.serverQueue().takePaces(), ElementsAre(Pace::mayBlock)) << "a stop waits for sinks";
    (void)run();
    EXPECT_TRUE(session->started()) << "exactly 5 seconds";
    device.clock.advance(milliseconds(1));
    device.workQueues.elapse(milliseconds(500));
    EXPECT_TRUE(session->started()) << "on the server queue";
    (void)run();
    EXPECT_FALSE(session->started());
    EXPECT_EQ(script.count("stop Late"), 1U) << "workers stop as they do in any session";
    EXPECT_EQ(service->singleMessageSession(), nullptr);
    EXPECT_EQ(device.workQueues.delayedCalls(), 0U) << "an idle service makes no wake-ups";

    send(client, {});
    EXPECT_NE(service->singleMessageSession(), session);
    send(client, {});
    EXPECT_EQ(device.workQueues.delayedCalls(), 1U);
}

TEST_F(ServiceTest, ALostClientIsRemovedOnceAndReportedOnce) {
    Connection client = connect(10);
    open(client, 7);
    client->object().createReportingSession(8, {});
    device.clock.advance(milliseconds(2500));
    client->interrupt();
    client->invalidate();
    EXPECT_EQ(service->getAllClients().size(), 1U) << "on the queue, not on the connection's thread";
    device.clock.advance(milliseconds(9000)); // how long the queue takes does not count
    (void)run();
    EXPECT_THAT(service->getAllClients(), IsEmpty());
    EXPECT_EQ(script.count("stop Init"), 1U) << "only what was started is stopped";
    EXPECT_EQ(find(8), nullptr);
    EXPECT_EQ(device.log.count("removing 10 from the server client list"), 1U);
    EXPECT_THAT(device.analyticsEvents.payloads(kUptimeEvent),
                ElementsAre(Dictionary{{"processName", "app10"}, {"seconds", 2.5}}));
}

TEST_F(ServiceTest, UptimeOfAClientThatIsNotKnown) {
    const auto nameless = device.connections.connect(10);
    nameless->invalidate();
    (void)run();
    const Connection gone = connect(11);
    gone->interrupt();
    (void)run();
    gone->dropObject();
    gone->invalidate();
    (void)run();
    EXPECT_EQ(device.log.count("invalidationHandler: connection exited process=unknown uptime_sec=-1"), 1U);
    EXPECT_THAT(device.analyticsEvents.events(), IsEmpty());

    const Connection fromTheFuture = connect(12);
    device.clock.advance(milliseconds(-1500));
    fromTheFuture->invalidate();
    (void)run();
    EXPECT_THAT(device.analyticsEvents.payloads(kUptimeEvent),
                ElementsAre(Dictionary{{"processName", "app12"}, {"seconds", 1.5}}));
}

TEST_F(ServiceTest, ShutDownWorksOffWhatIsQueuedThenStopsEverything) {
    const Connection first = connect(10);
    const Connection second = connect(11);
    send(first, {});
    const SessionRef single = service->singleMessageSession();
    open(first, 7);
    open(second, 8);
    (void)script.take();
    first->object().sendMessage({{"last", 1}}, 14, 11, {7}, note<>("send"));
    service->shutDown([done = note<>("completed")] { done(nullptr); });
    EXPECT_THAT(takeReplies(), ElementsAre("send"));
    (void)run();
    EXPECT_EQ(script.take().front(), "message Init 14/11");
    EXPECT_THAT(takeReplies(), ElementsAre("send", "completed"));
    EXPECT_THAT(service->getAllClients(), IsEmpty());
    EXPECT_FALSE(single->started());
    EXPECT_EQ(service->singleMessageSession(), nullptr);
    EXPECT_EQ(device.workQueues.delayedCalls(), 0U);
    first->invalidate();
    (void)run();
    EXPECT_EQ(device.log.count("removing 10 from the server client list"), 1U);
    const auto uptimes = device.analyticsEvents.payloads(kUptimeEvent);
    ASSERT_EQ(uptimes.size(), 2U);
    EXPECT_EQ(uptimes[0].find("processName")->stringValue(), "app10");
    EXPECT_EQ(uptimes[1].find("processName")->stringValue(), "app11");
}

TEST_F(ServiceTest, DestroyingTheServiceEndsTheReaper) {
    const Connection client = connect(10);
    send(client, {});
    const SessionRef session = service->singleMessageSession();
    device.clock.advance(milliseconds(5001));
    device.workQueues.elapse(milliseconds(500)); // its work is on its way
    service.reset();
    (void)run();
    EXPECT_TRUE(session->started()) << "dropped unstopped";
    EXPECT_EQ(device.workQueues.delayedCalls(), 0U);
}

} // namespace
} // namespace tamblo
