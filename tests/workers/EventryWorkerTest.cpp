#include "session/WorkerClass.h"
#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"
#include "workers/sinks/ZRReportingSessionEventryWorker.h"

#include <gmock/gmock.h>

#include <string>
#include <vector>

namespace tamblo {
namespace {

TEST(WorkerClassListTest, SeventeenRowsInOrderWithTheirAnswers) {
    std::vector<std::string> rows;
    for (const WorkerClass& row : workerClassList()) {
        std::string text(row.name.substr(std::string_view("ZRReportingSession").size()));
        text += row.role.producer ? " P" : "";
        text += row.role.consumer ? " C" : "";
        text += row.startOnInit ? " I" : "";
        text += row.handleSingleMessageSession ? " S" : "";
        rows.push_back(std::move(text));
    }
    EXPECT_THAT(rows,
                testing::ElementsAre("TraceWorker", "VolumeMessagesWorker P", "KaleenMessagesWorker P",
                                     "SummaryWorker P C", "InputMessagesWorker P", "EventryWorker C I S",
                                     "JouleryWorker C I S", "MemoryLogWorker C I", "QMXWorker C I S",
                                     "DriverSnapshotWorker P", "SystemMonitorWorker P", "ZephWorker C S",
                                     "DPWorker C", "SummaryJsonFileWorker", "AudioRegistrationWorker C",
                                     "RtcWorker C S", "QuilletWorker C S"));
}

class EventryWorkerTest : public testing::Test {
protected:
    MessageRef handle(AudioEventCategory category, AudioEventType type, Dictionary payload = {{"a", 1}}) {
        MessageRef message = messageOf(std::move(payload), category, type);
        worker->handleMessage(message);
        return message;
    }

    FakePlatform device;
    std::shared_ptr<ZRReportingSession> session = ZRReportingSession::initWithID(5, {1});
    std::shared_ptr<ZRReportingSessionEventryWorker> worker =
        std::make_shared<ZRReportingSessionEventryWorker>(session);
};

TEST_F(EventryWorkerTest, OffersEachMessageUnderBothNamesInOrder) {
    const struct {
        AudioServiceType service;
        AudioEventCategory category;
        AudioEventType type;
        const char* general;
        const char* ofService;
    } cases[] = {
        {2, 0x08000001, 11, "com.vandra.tamblo.Session_Generic.Summary",
         "com.vandra.telephony.Session_Generic.Summary"},
        {99, 0xFFFFFFFF, 65535, "com.vandra.tamblo.Undefined.Unknown",
         "com.vandra.unknown.Undefined.Unknown"},
        {98, 0xFFFFFFFF, 0, "com.vandra.tamblo.Undefined.Generic", "com.vandra.unknown.Undefined.Generic"},
        {0, 14, 1, "com.vandra.tamblo.Volume.Start", "com.vandra.generic.Volume.Start"},
        {13, 14, 1, "com.vandra.tamblo.Volume.Start", "com.vandra.systemsounds.Volume.Start"},
    };
    for (const auto& c : cases) {
        for (int round = 0; round < 2; ++round) {
            session->setServiceType(c.service);
            device.analyticsEvents.clear();
            (void)handle(c.category, c.type, {{"n", round}});
            EXPECT_THAT(device.analyticsEvents.asked(), testing::ElementsAre(c.general, c.ofService));
            ASSERT_EQ(device.analyticsEvents.events().size(), 2U);
            EXPECT_EQ(device.analyticsEvents.events()[1].name, c.ofService);
            EXPECT_EQ(device.analyticsEvents.events()[1].payload, (Dictionary{{"n", round}}));
        }
    }
}

TEST_F(EventryWorkerTest, TakesAPayloadOnlyForANameInUse) {
    device.analyticsEvents.setEventsInUse({{"com.vandra.unknown.Volume.Stop"}});
    (void)handle(14, 1);
    EXPECT_EQ(device.analyticsEvents.payloadsTaken(), 0);
    const MessageRef message = handle(14, 2);
    ASSERT_EQ(device.analyticsEvents.payloadsTaken(), 1);
    message->editPayload([](Dictionary& payload) { payload.set("later", true); });
    EXPECT_EQ(device.analyticsEvents.events().front().payload, (Dictionary{{"a", 1}}))
        << "as it stood when sent";
}

TEST_F(EventryWorkerTest, AFailingServiceAndALostSessionDoNoHarm) {
    device.analyticsEvents.setFailing(true);
    (void)handle(14, 1);
    EXPECT_THAT(device.analyticsEvents.events(), testing::IsEmpty());
    device.analyticsEvents.setFailing(false);
    const std::weak_ptr<ZRReportingSession> lost = session;
    session.reset();
    EXPECT_TRUE(lost.expired()) << "the worker holds its session weakly";
    (void)handle(14, 1);
    EXPECT_THAT(device.analyticsEvents.events(), testing::IsEmpty());
}

TEST_F(EventryWorkerTest, RunsFromTheSessionsCreationOn) {
    session->setServiceType(AudioServiceTypeHaptics);
    session->sendMessage(messageOf({{"a b", 1}}, 14, 11));
    session->sendMessage(messageOf({{"a b", 1}}, 14, 11));
    const auto payloads = device.analyticsEvents.payloads("com.vandra.haptics.Volume.Summary");
    ASSERT_EQ(payloads.size(), 1U) << "a repeat is not offered";
    EXPECT_EQ(payloads.front(), (Dictionary{{"a_b", 1},
                                            {"audiotag", "VolumeSummary"},
                                            {"HostApplicationDisplayID", "Unknown"},
                                            {"invalid_timestamp", "nil"},
                                            {"zrreporting_timestamp", device.clock.seconds()}}));
}

} // namespace
} // namespace tamblo
