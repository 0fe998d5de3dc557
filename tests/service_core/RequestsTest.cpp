#include "tests/service_core/ServiceTestBase.h"

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class RequestsTest : public ServiceTestBase {
protected:
    using ServiceTestBase::ServiceTestBase;
    Connection client = connect(10);
    ZRReportingServiceProtocol& requests = client->object();
};

class InternalBuildRequestsTest : public RequestsTest {
protected:
    InternalBuildRequestsTest() : RequestsTest(true) {}
};

TEST_F(RequestsTest, UnknownReportersAreAnsweredWithSuccess) {
    // ID 0 names no session, even once there is one.
    requests.createReportingSession(0, {});
    (void)run();
    (void)script.take();
    for (const ReporterID id : {ReporterID{0}, ReporterID{99}}) {
        requests.setServiceType(2, id, noteBoolean("type"));
        requests.setConfiguration({{"a", 1}}, id, noteBoolean("configure"));
        requests.startReportingSessionForID(id, noteBoolean("start"));
        requests.stopReportingSessionForID(id, noteBoolean("stop"));
        requests.destroyReportingSession(id, noteBoolean("destroy"));
        requests.getServiceNameForReporterID(id, noteWith<std::uint16_t>("name"));
        Dictionary validated;
        requests.reporterID(id, [&](const ReplyError*, const Dictionary& result) { validated = result; });
        EXPECT_THAT(takeReplies(), IsEmpty()) << "nothing happens on the connection's thread";
        (void)run();
        std::vector<std::string> expected{"type 1", "configure 1", "start 1",
                                          "stop 1", "destroy 1",   "name 65535"};
        if (id == 0) {
            expected.emplace_back("name 65535");
        }
        EXPECT_EQ(takeReplies(), expected);
        EXPECT_EQ(validated, (Dictionary{{"reporterID", 0}, {"serviceType", 65535}}));
    }
    send(client, {99});
    EXPECT_THAT(takeReplies(), ElementsAre("send"));
    EXPECT_THAT(script.take(), IsEmpty());
}

TEST_F(RequestsTest, TheStartReplyIsHeldUntilTheStop) {
    requests.createReportingSession(7, noteBoolean("create"));
    requests.setServiceType(AudioServiceTypeTest, 7, {});
    requests.startReportingSessionForID(7, noteBoolean("start"));
    requests.startReportingSessionForID(7, noteBoolean("again"));
    (void)run();
    EXPECT_THAT(takeReplies(), ElementsAre("create 1"));
    requests.stopReportingSessionForID(7, noteBoolean("stop"));
    (void)run();
    EXPECT_THAT(takeReplies(), ElementsAre("start 1", "stop 1"));
    requests.stopReportingSessionForID(7, noteBoolean("stop"));
    (void)run();
    EXPECT_THAT(takeReplies(), ElementsAre("stop 1")) << "answered once";
    EXPECT_EQ(device.log.count("Stop called, but session==nil or session.started==false. reporterID=7 "
                               "session=reporterID=7,serviceName=test,ownerPid=10,clientProcessName=app10"),
              1U);
    EXPECT_EQ(device.log.count("1 active reporting session(s) [reporterID=7,"), 1U);
}

TEST_F(RequestsTest, AReplyHeldByASessionThatGoesIsNeverAnswered) {
    const std::pair<const char*, std::function<void()>> endings[] = {
        {"destroyed", [&] { requests.destroyReportingSession(7, {}); }},
        {"replaced", [&] { requests.createReportingSession(7, {}); }},
        {"changed", [&] { requests.setServiceType(3, 7, {}); }},
        {"left", [&] { client->interrupt(); }},
    };
    for (const auto& [what, end] : endings) {
        requests.createReportingSession(7, {});
        requests.startReportingSessionForID(7, noteBoolean("start"));
        (void)run();
        end();
        (void)run();
        EXPECT_THAT(takeReplies(), IsEmpty()) << what;
        const bool isStopped = script.count("stop Init") == 1;
        EXPECT_EQ(isStopped, what == std::string_view("destroyed") || what == std::string_view("left"))
            << what;
        (void)script.take();
    }
}

TEST_F(InternalBuildRequestsTest, ATestSessionAnswersItsStartAtOnceAndAtTheStop) {
    requests.createReportingSession(8, {});
    requests.startReportingSessionForID(8, noteBoolean("other"));
    requests.createReportingSession(7, {});
    requests.setServiceType(AudioServiceTypeTest, 7, {});
    requests.startReportingSessionForID(7, noteBoolean("start"));
    (void)run();
    EXPECT_THAT(takeReplies(), ElementsAre("start 1"));
    requests.stopReportingSessionForID(7, noteBoolean("stop"));
    (void)run();
    EXPECT_THAT(takeReplies(), ElementsAre("start 1", "stop 1"));
}

TEST_F(InternalBuildRequestsTest, PayloadsWithoutReporterIDsAreMarked) {
    open(client, 7);
    const auto lastPayload = [&] { return find(7)->messages().back()->payload(); };
    send(client, {}, {{"a", 1}});
    EXPECT_EQ(lastPayload().find("sendSingleMessage")->integerValue(), 1);
    send(client, {7}, {{"a", 2}});
    EXPECT_FALSE(lastPayload().contains("sendSingleMessage"));
}

TEST_F(RequestsTest, AChangeOfServiceTypeMakesAFreshSessionOfTheSameClient) {
    open(client, 7);
    requests.setConfiguration({{"HostApplicationDisplayID", "com.app"}}, 7, {});
    send(client, {7}, {{"volume", 3}});
    const SessionRef before = find(7);
    requests.setServiceType(65535, 7, {});
    (void)run();
    EXPECT_EQ(find(7), before) << "the same type";
    requests.setServiceType(2, 7, noteBoolean("type"));
    (void)run();
    const SessionRef after = find(7);
    ASSERT_NE(after, before);
    EXPECT_FALSE(after->started());
    EXPECT_TRUE(before->started()) << "dropped, not stopped";
    EXPECT_THAT(after->messages(), IsEmpty());
    EXPECT_EQ(after->serviceName(), "telephony");
    EXPECT_EQ(after->clientProcessName(), "app10");
    EXPECT_THAT(after->processIdentifiers(), ElementsAre(10));
    EXPECT_EQ(after->configuration().find("HostApplicationDisplayID")->stringValue(), "com.app");
    EXPECT_EQ(after->previousValues().find("volume")->integerValue(), 3);
    EXPECT_THAT(service->getAllActiveReportingSessions(), IsEmpty());
}

TEST_F(RequestsTest, DisabledReportingRefusesMessages) {
    open(client, 7);
    service->setReportingEnabled(false);
    send(client, {7});
    send(client, {});
    EXPECT_THAT(takeReplies(),
                ElementsAre("send com.vandra.audio.reporting 1", "send com.vandra.audio.reporting 1"));
    EXPECT_EQ(find(7), nullptr);
    EXPECT_EQ(service->singleMessageSession(), nullptr);
    service->setReportingEnabled(true);
    send(client, {7});
    EXPECT_THAT(takeReplies(), ElementsAre("send"));
}

TEST_F(RequestsTest, LookupsCrossClientsChangesDoNot) {
    const Connection other = connect(11);
    open(client, 7);
    requests.createReportingSession(8, {});
    requests.createReportingSession(9, {});
    requests.setServiceType(2, 8, {});
    open(other, 9);
    other->object().setServiceType(3, 8, noteBoolean("type"));
    other->object().setConfiguration({{"a", 1}}, 8, {});
    other->object().startReportingSessionForID(8, noteBoolean("start"));
    other->object().stopReportingSessionForID(7, noteBoolean("stop"));
    other->object().destroyReportingSession(7, noteBoolean("destroy"));
    other->object().getServiceNameForReporterID(8, noteWith<std::uint16_t>("name"));
    other->object().setServiceType(4, 9, {});
    other->object().getServiceNameForReporterID(9, noteWith<std::uint16_t>("own"));
    Dictionary validated;
    other->object().reporterID(8, [&](const ReplyError*, const Dictionary& result) { validated = result; });
    std::vector<ReporterID> all;
    other->object().getAllReporters(
        [&](const ReplyError*, const std::vector<ReporterID>& result) { all = result; });
    (void)run();
    EXPECT_THAT(takeReplies(), ElementsAre("type 1", "start 1", "stop 1", "destroy 1", "name 2", "own 4"));
    EXPECT_EQ(validated, (Dictionary{{"reporterID", 8}, {"serviceType", 2}}));
    EXPECT_THAT(all, ElementsAre(7, 8, 9, 9));
    EXPECT_TRUE(find(7)->started());
    EXPECT_FALSE(find(8)->started());
    EXPECT_FALSE(find(8)->configuration().contains("a"));
}

TEST_F(RequestsTest, PacesAndTracePoints) {
    (void)device.serverQueue().takePaces();
    (void)device.tracePoints.take();
    requests.createReportingSession(7, {});
    requests.startReportingSessionForID(7, {});
    requests.sendMessage({}, 1, 1, {5}, {});
    requests.stopReportingSessionForID(7, {});
    requests.destroyReportingSession(7, {});
    EXPECT_THAT(device.serverQueue().takePaces(),
                ElementsAre(Pace::quick, Pace::mayBlock, Pace::quick, Pace::mayBlock, Pace::mayBlock));
    (void)run();
    std::vector<std::uint32_t> ofRequests;
    for (const std::uint32_t code : device.tracePoints.take()) {
        if (code <= 0x21044824) {
            ofRequests.push_back(code);
        }
    }
    EXPECT_THAT(ofRequests, ElementsAre(0x21044814, 0x21044818, 0x21044824, 0x2104481C, 0x21044820));
}

TEST_F(RequestsTest, KillingEndsTheProcessAtOnce) {
    requests.killService();
    EXPECT_EQ(exitStatus(), 2);
    EXPECT_EQ(device.log.count("DESTROYING SERVICE"), 1U);
}

TEST_F(RequestsTest, RequestsOutliveTheService) {
    service.reset();
    requests.createReportingSession(7, noteBoolean("create"));
    requests.sendMessage({}, 1, 1, {7}, note("send"));
    requests.killService();
    client->interrupt();
    (void)run();
    EXPECT_THAT(takeReplies(), ElementsAre("create 1", "send com.vandra.audio.reporting 1"));
    EXPECT_EQ(exitStatus(), 0);
}

} // namespace
} // namespace tamblo
