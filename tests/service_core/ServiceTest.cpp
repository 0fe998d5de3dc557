#include "tests/service_core/ServiceTestBase.h"

#include <map>
#include <random>

namespace tamblo {
namespace {

using std::chrono::milliseconds;
using testing::ElementsAre;
using testing::IsEmpty;
using ReporterIDs = std::vector<ReporterID>;

constexpr const char* kRefused = "send com.vandra.audio.reporting 1";

class ServiceTest : public ServiceTestBase {
protected:
    using ServiceTestBase::ServiceTestBase;
    Connection client = connect(10);
    ZRReportingServiceProtocol& requests = client->object();
};

class InternalBuildTest : public ServiceTest {
protected:
    InternalBuildTest() : ServiceTest(true) {}
};

TEST_F(ServiceTest, UnknownReportersAreAnsweredWithSuccess) {
    // ID 0 names no session, even once there is one.
    requests.createReportingSession(0, {});
    (void)run();
    (void)script.take();
    for (const ReporterID id : {ReporterID{0}, ReporterID{99}}) {
        requests.setServiceType(2, id, note<bool>("type"));
        requests.setConfiguration({{"a", 1}}, id, note<bool>("configure"));
        requests.startReportingSessionForID(id, note<bool>("start"));
        requests.stopReportingSessionForID(id, note<bool>("stop"));
        requests.destroyReportingSession(id, note<bool>("destroy"));
        requests.reporterID(id, note<Dictionary>("found"));
        requests.getServiceNameForReporterID(id, note<std::uint16_t>(id == 0 ? "twice" : "once"));
    }
    EXPECT_THAT(takeReplies(), IsEmpty()) << "nothing happens on the connection's thread";
    send(client, {99});
    const char* const found = R"(found {"reporterID":0,"serviceType":65535})";
    EXPECT_THAT(takeReplies(),
                ElementsAre("type true", "configure true", "start true", "stop true", "destroy true", found,
                            "twice 65535", "twice 65535", "type true", "configure true", "start true",
                            "stop true", "destroy true", found, "once 65535", "send"));
    EXPECT_THAT(script.take(), IsEmpty());
}

TEST_F(ServiceTest, TheStartReplyIsHeldUntilTheStop) {
    requests.createReportingSession(7, note<bool>("create"));
    requests.setServiceType(AudioServiceTypeTest, 7, {});
    requests.startReportingSessionForID(7, note<bool>("start"));
    requests.startReportingSessionForID(7, note<bool>("again"));
    EXPECT_THAT(answers(), ElementsAre("create true"));
    requests.stopReportingSessionForID(7, note<bool>("stop"));
    requests.stopReportingSessionForID(7, note<bool>("stop"));
    EXPECT_THAT(answers(), ElementsAre("start true", "stop true", "stop true")) << "answered once";
}

TEST_F(InternalBuildTest, OfATestSessionItIsAnsweredAtOnceAndPayloadsForAllAreMarked) {
    open(client, 8);
    requests.createReportingSession(7, {});
    requests.setServiceType(AudioServiceTypeTest, 7, {});
    requests.startReportingSessionForID(7, note<bool>("start"));
    EXPECT_THAT(answers(), ElementsAre("start true"));
    requests.stopReportingSessionForID(7, {});
    EXPECT_THAT(answers(), ElementsAre("start true")) << "and at the stop";
    for (const ReporterIDs& to : {ReporterIDs{}, ReporterIDs{8}}) {
        send(client, to, {{"recipients", to.size()}});
        EXPECT_EQ(shown(find(8)->messages().back()->payload(), {"sendSingleMessage"}), to.empty() ? "1" : "");
    }
}

TEST_F(ServiceTest, AReplyHeldByASessionThatGoesIsNeverAnswered) {
    const std::pair<std::function<void()>, std::size_t> endings[] = {
        {[&] { requests.destroyReportingSession(7, {}); }, 1},
        {[&] { requests.createReportingSession(7, {}); }, 0},
        {[&] { requests.setServiceType(3, 7, {}); }, 0},
        {[&] { client->interrupt(); }, 1},
    };
    for (const auto& [end, stops] : endings) {
        requests.createReportingSession(7, {});
        requests.startReportingSessionForID(7, note<bool>("start"));
        (void)run();
        end();
        EXPECT_THAT(answers(), IsEmpty());
        EXPECT_EQ(script.count("stop Init"), stops);
        (void)script.take();
    }
}

TEST_F(ServiceTest, AChangeOfServiceTypeMakesAFreshSessionOfTheSameClient) {
    open(client, 7);
    requests.setConfiguration({{"HostApplicationDisplayID", "com.app"}}, 7, {});
    send(client, {7}, {{"volume", 3}});
    const SessionRef before = find(7);
    requests.setServiceType(65535, 7, {});
    (void)run();
    EXPECT_EQ(find(7), before) << "the same type";
    requests.setServiceType(2, 7, {});
    (void)run();
    const SessionRef after = find(7);
    EXPECT_TRUE(before->started()) << "dropped, not stopped";
    EXPECT_EQ(after->description(), "reporterID=7,serviceName=telephony,ownerPid=10,clientProcessName=app10,"
                                    "HostApplicationDisplayID=com.app,started=0,singleMessageSession=0");
    EXPECT_THAT(after->messages(), IsEmpty());
    EXPECT_EQ(shown(after->previousValues(), {"volume"}), "3");
    EXPECT_THAT(service->getAllActiveReportingSessions(), IsEmpty());
}

TEST_F(ServiceTest, DisabledReportingRefusesMessages) {
    open(client, 7);
    service->setReportingEnabled(false);
    send(client, {7});
    send(client, {});
    EXPECT_THAT(takeReplies(), ElementsAre(kRefused, kRefused));
    EXPECT_EQ(find(7), nullptr);
    EXPECT_EQ(service->singleMessageSession(), nullptr);
    service->setReportingEnabled(true);
    send(client, {7});
    EXPECT_THAT(takeReplies(), ElementsAre("send"));
}

TEST_F(ServiceTest, LookupsCrossClientsChangesDoNot) {
    const Connection other = connect(11);
    ZRReportingServiceProtocol& others = other->object();
    open(client, 7);
    requests.createReportingSession(8, {});
    requests.setServiceType(2, 8, {});
    requests.createReportingSession(9, {});
    open(other, 9);
    others.setServiceType(3, 8, {});
    others.setConfiguration({{"a", 1}}, 8, {});
    others.startReportingSessionForID(8, {});
    others.stopReportingSessionForID(7, {});
    others.destroyReportingSession(7, {});
    others.setServiceType(4, 9, {});
    others.sendMessage({}, 1, 1, {8}, {});
    others.getServiceNameForReporterID(9, note<std::uint16_t>("own"));
    others.reporterID(8, note<Dictionary>("found"));
    others.getAllReporters(note<ReporterIDs>("all"));
    EXPECT_THAT(answers(),
                ElementsAre("own 4", R"(found {"reporterID":8,"serviceType":2})", "all { 7, 8, 9, 9 }"));
    EXPECT_TRUE(find(7)->started());
    EXPECT_FALSE(find(8)->started());
    EXPECT_FALSE(find(8)->configuration().contains("a"));
    EXPECT_THAT(device.tracePoints.codes,
                testing::IsSupersetOf({0x21044814, 0x21044818, 0x2104481C, 0x21044820, 0x21044824}));
}

TEST_F(ServiceTest, KillingEndsTheProcessAtOnceWhileThereIsAService) {
    requests.killService();
    EXPECT_EQ(std::exchange(exitStatus, 0), 2);
    send(client, {});
    const SessionRef single = service->singleMessageSession();
    device.clock.advance(milliseconds(5001));
    device.workQueues.elapse(milliseconds(500)); // work for the idle session is on its way
    service.reset();
    requests.createReportingSession(7, note<bool>("create"));
    requests.sendMessage({}, 1, 1, {7}, note<>("send"));
    requests.killService();
    client->interrupt();
    EXPECT_THAT(answers(), ElementsAre("send", "create true", kRefused));
    EXPECT_EQ(exitStatus, 0);
    EXPECT_TRUE(single->started()) << "dropped unstopped";
    EXPECT_EQ(device.workQueues.delayedCalls(), 0U);
}

TEST_F(ServiceTest, TheRegistryFindsWhatAWalkOverTheClientsWould) {
    std::mt19937 random(11);
    const auto below = [&](std::size_t limit) { return random() % limit; };
    std::vector<Connection> connections;
    for (int step = 0; step < 3000; ++step) {
        if (connections.empty() || (connections.size() < 6 && below(31) == 0)) {
            connections.push_back(connect(100 + step));
        }
        const auto at = connections.begin() + static_cast<int>(below(connections.size()));
        ZRReportingServiceProtocol& to = (*at)->object();
        const auto id = static_cast<ReporterID>(1 + below(5));
        const std::function<void()> steps[] = {
            [&] { to.destroyReportingSession(id, {}); },
            [&] { to.setServiceType(static_cast<std::uint16_t>(below(4)), id, {}); },
            [&] { to.stopReportingSessionForID(id, {}); },
            [&] { to.startReportingSessionForID(id, {}); },
            [&] { to.createReportingSession(id, {}); },
        };
        if (below(13) == 0) {
            (*at)->invalidate();
            connections.erase(at);
        } else {
            steps[below(std::size(steps))]();
        }
        (void)run();
        std::vector<SessionRef> active;
        std::map<ReporterID, SessionRef> first;
        for (const ClientRef& each : service->getAllClients()) {
            for (const auto& [key, session] : each->clientReportingSessionMap()) {
                first.emplace(key, session);
                if (session->started()) {
                    active.push_back(session);
                }
            }
        }
        ASSERT_EQ(service->getAllActiveReportingSessions(), active) << step;
        for (ReporterID each = 1; each <= 5; ++each) {
            ASSERT_EQ(find(each), first[each]) << step;
        }
        device.log.clear();
    }
}

TEST_F(ServiceTest, MessagesGoToTheSessionsOfTheirIDsOrToEveryStartedOne) {
    const Connection other = connect(11);
    open(other, 8);
    open(client, 7);
    other->object().createReportingSession(9, {});
    send(client, {}, {{"to", "both"}});
    const Dictionary& sent = find(7)->messages().back()->payload();
    EXPECT_EQ(sent, find(8)->messages().back()->payload());
    EXPECT_TRUE(sent.contains("to"));
    EXPECT_FALSE(sent.contains("sendSingleMessage"));
    EXPECT_THAT(found({}), ElementsAre(7, 8)) << "in the order of the clients";
    EXPECT_THAT(found({9, 0, 7, 99, 9}), ElementsAre(9, 7, 9));
    EXPECT_THAT(found({0}), IsEmpty()) << "no falling back when IDs were given";
    EXPECT_EQ(device.log.count("found reporting session 9 for client 11"), 2U);
    EXPECT_THAT(device.log.texts("failed to find"), ElementsAre("failed to find reporting session 99"));
    EXPECT_EQ(service->singleMessageSession(), nullptr);
}

TEST_F(ServiceTest, TheSingleMessageSessionLivesUntilItIsIdleForMoreThanFiveSeconds) {
    send(client, {});
    const SessionRef session = service->singleMessageSession();
    ASSERT_NE(session, nullptr);
    EXPECT_EQ(session->description(),
              "reporterID=1,serviceName=standalone,ownerPid=4321,clientProcessName=(null),"
              "HostApplicationDisplayID=Unknown,started=1,singleMessageSession=1");
    EXPECT_EQ(find(1), nullptr) << "it cannot be had by its ID";

    device.clock.advance(milliseconds(4000));
    send(client, {});
    EXPECT_EQ(session->messages().back()->payload().find("a")->integerValue(), 1);
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
    EXPECT_EQ(script.count("stop Late"), 1U) << "workers stop as they do in any session";
    EXPECT_EQ(service->singleMessageSession(), nullptr);
    EXPECT_EQ(device.workQueues.delayedCalls(), 0U) << "an idle service makes no wake-ups";

    send(client, {});
    EXPECT_NE(service->singleMessageSession(), session);
    send(client, {});
    EXPECT_EQ(device.workQueues.delayedCalls(), 1U);
}

TEST_F(ServiceTest, ALostClientIsRemovedAndItsUptimeReportedOnce) {
    open(client, 7);
    requests.createReportingSession(8, {});
    device.clock.advance(milliseconds(2500));
    client->interrupt();
    client->invalidate();
    EXPECT_EQ(service->getAllClients().size(), 1U) << "on the queue, not on the connection's thread";
    device.clock.advance(milliseconds(9000)); // how long the queue takes does not count
    (void)run();
    EXPECT_THAT(service->getAllClients(), IsEmpty());
    EXPECT_EQ(script.count("stop Init"), 1U) << "only what was started is stopped";
    const Connection fromTheFuture = connect(12);
    device.clock.advance(milliseconds(-1500));
    fromTheFuture->invalidate();
    const auto nameless = device.connections.connect({1000, 99}, turns);
    nameless->invalidate();
    (void)run();
    const Connection gone = connect(11);
    gone->interrupt();
    (void)run();
    gone->dropObject();
    gone->invalidate();
    (void)run();
    EXPECT_EQ(device.log.count("invalidationHandler: connection exited process=unknown uptime_sec=-1"), 1U);
    EXPECT_THAT(device.analyticsEvents.payloads(kUptimeEvent),
                ElementsAre(Dictionary{{"processName", "app10"}, {"seconds", 2.5}},
                            Dictionary{{"processName", "app12"}, {"seconds", 1.5}}));
}

} // namespace
} // namespace tamblo
