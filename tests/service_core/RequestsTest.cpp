#include "tests/service_core/ServiceTestBase.h"

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using ReporterIDs = std::vector<ReporterID>;

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
        requests.setServiceType(2, id, note<bool>("type"));
        requests.setConfiguration({{"a", 1}}, id, note<bool>("configure"));
        requests.startReportingSessionForID(id, note<bool>("start"));
        requests.stopReportingSessionForID(id, note<bool>("stop"));
        requests.destroyReportingSession(id, note<bool>("destroy"));
        requests.reporterID(id, note<Dictionary>("found"));
        requests.getServiceNameForReporterID(id, note<std::uint16_t>("name"));
        EXPECT_THAT(takeReplies(), IsEmpty()) << "nothing happens on the connection's thread";
        (void)run();
        std::vector<std::string> expected{"type true",    "configure true",
                                          "start true",   "stop true",
                                          "destroy true", R"(found {"reporterID":0,"serviceType":65535})",
                                          "name 65535"};
        if (id == 0) {
            expected.emplace_back("name 65535");
        }
        EXPECT_EQ(takeReplies(), expected);
    }
    send(client, {99});
    EXPECT_THAT(takeReplies(), ElementsAre("send"));
    EXPECT_THAT(script.take(), IsEmpty());
}

TEST_F(RequestsTest, TheStartReplyIsHeldUntilTheStop) {
    requests.createReportingSession(7, note<bool>("create"));
    requests.setServiceType(AudioServiceTypeTest, 7, {});
    requests.startReportingSessionForID(7, note<bool>("start"));
    requests.startReportingSessionForID(7, note<bool>("again"));
    (void)run();
    EXPECT_THAT(takeReplies(), ElementsAre("create true"));
    requests.stopReportingSessionForID(7, note<bool>("stop"));
    requests.stopReportingSessionForID(7, note<bool>("stop"));
    (void)run();
    EXPECT_THAT(takeReplies(), ElementsAre("start true", "stop true", "stop true")) << "answered once";
}

TEST_F(InternalBuildRequestsTest, ATestSessionAnswersItsStartAtOnceAndAtTheStop) {
    requests.createReportingSession(8, {});
    requests.startReportingSessionForID(8, note<bool>("other"));
    requests.createReportingSession(7, {});
    requests.setServiceType(AudioServiceTypeTest, 7, {});
    requests.startReportingSessionForID(7, note<bool>("start"));
    (void)run();
    EXPECT_THAT(takeReplies(), ElementsAre("start true"));
    requests.stopReportingSessionForID(7, {});
    (void)run();
    EXPECT_THAT(takeReplies(), ElementsAre("start true"));
}

TEST_F(RequestsTest, AReplyHeldByASessionThatGoesIsNeverAnswered) {
    const struct {
        const char* what;
        std::function<void()> end;
        std::size_t stops;
    } endings[] = {
        {"destroyed", [&] { requests.destroyReportingSession(7, {}); }, 1},
        {"replaced", [&] { requests.createReportingSession(7, {}); }, 0},
        {"changed", [&] { requests.setServiceType(3, 7, {}); }, 0},
        {"left", [&] { client->interrupt(); }, 1},
    };
    for (const auto& ending : endings) {
        requests.createReportingSession(7, {});
        requests.startReportingSessionForID(7, note<bool>("start"));
        (void)run();
        ending.end();
        (void)run();
        EXPECT_THAT(takeReplies(), IsEmpty()) << ending.what;
        EXPECT_EQ(script.count("stop Init"), ending.stops) << ending.what;
        (void)script.take();
    }
}

TEST_F(InternalBuildRequestsTest, PayloadsWithoutReporterIDsAreMarked) {
    open(client, 7);
    for (const bool isForAll : {true, false}) {
        send(client, isForAll ? ReporterIDs{} : ReporterIDs{7}, {{"for all", isForAll}});
        EXPECT_EQ(find(7)->messages().back()->payload().contains("sendSingleMessage"), isForAll);
    }
}

TEST_F(RequestsTest, AChangeOfServiceTypeMakesAFreshSessionOfTheSameClient) {
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
    ZRReportingServiceProtocol& others = other->object();
    open(client, 7);
    requests.createReportingSession(8, {});
    requests.createReportingSession(9, {});
    requests.setServiceType(2, 8, {});
    open(other, 9);
    others.setServiceType(3, 8, {});
    others.setConfiguration({{"a", 1}}, 8, {});
    others.startReportingSessionForID(8, note<bool>("start"));
    others.stopReportingSessionForID(7, {});
    others.destroyReportingSession(7, {});
    others.getServiceNameForReporterID(8, note<std::uint16_t>("name"));
    others.setServiceType(4, 9, {});
    others.getServiceNameForReporterID(9, note<std::uint16_t>("own"));
    others.reporterID(8, note<Dictionary>("found"));
    others.getAllReporters(note<ReporterIDs>("all"));
    (void)run();
    EXPECT_THAT(takeReplies(),
                ElementsAre("start true", "name 2", "own 4", R"(found {"reporterID":8,"serviceType":2})",
                            "all { 7, 8, 9, 9 }"));
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
    std::vector<std::uint32_t> codes = device.tracePoints.take();
    std::erase_if(codes, [](std::uint32_t code) { return code > 0x21044824; }); // a session's own
    EXPECT_THAT(codes, ElementsAre(0x21044814, 0x21044818, 0x21044824, 0x2104481C, 0x21044820));
}

TEST_F(RequestsTest, KillingEndsTheProcessAtOnceWhileThereIsAService) {
    requests.killService();
    EXPECT_EQ(std::exchange(exitStatus(), 0), 2);
    service.reset();
    requests.createReportingSession(7, note<bool>("create"));
    requests.sendMessage({}, 1, 1, {7}, note<>("send"));
    requests.killService();
    client->interrupt();
    (void)run();
    EXPECT_THAT(takeReplies(), ElementsAre("create true", "send com.vandra.audio.reporting 1"));
    EXPECT_EQ(exitStatus(), 0);
}

} // namespace
} // namespace tamblo
