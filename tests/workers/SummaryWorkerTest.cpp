#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"
#include "workers/producers/ZRReportingSessionSummaryWorker.h"

#include <gmock/gmock.h>

#include <string>

namespace tamblo {
namespace {

using testing::AllOf;
using testing::Contains;
using testing::Field;

class SummaryWorkerTest : public testing::Test {
protected:
    void send(Dictionary payload, AudioEventType type = AudioEventTypeGeneric) {
        session->sendMessage(messageOf(std::move(payload), AudioEventKindIO, type));
    }
    Dictionary stopAndTakeSummary() {
        device.analyticsEvents.clear();
        session->stop();
        const auto payloads = device.analyticsEvents.payloads("com.vandra.tamblo.Session_Generic.Summary");
        EXPECT_EQ(payloads.size(), 1U);
        return payloads.empty() ? Dictionary() : payloads[0];
    }
    FakePlatform device{LogLevel::standard};
    std::shared_ptr<ZRReportingSession> session = ZRReportingSession::initWithID(5, {1});
};

TEST_F(SummaryWorkerTest, CountsMessagesAndActivity) {
    // Without a message, the session's own start and stop records are none; a stop that stops nothing leaves
    // one more of them in the list.
    session->stop();
    session->start();
    EXPECT_EQ(shown(stopAndTakeSummary(), {"num_messages", "num_unique_messages", "num_redundant_messages",
                                           "active_count", "total_active_time", "average_active_time"}),
              "0 0 0 0 0.0 0.0");

    // What a session is sent before its start counts to the run that follows.
    send({{"n", 0}});
    session->start();
    session->start();
    for (const int n : {1, 2, 2, 2, 3}) {
        send({{"n", n}});
    }
    send({{"session_duration", 2.5}, {"issue_type", "overload"}});
    send({{"session_duration", "4 seconds"}});
    send({{"issue_type", "overload"}});
    send({{"issue_type", "overload"}});
    EXPECT_EQ(shown(stopAndTakeSummary(),
                    {"num_messages", "num_unique_messages", "num_redundant_messages", "active_count",
                     "total_active_time", "average_active_time", "overload_count"}),
              "10 7 3 2 6.5 3.25 1");

    // Messages are counted by the run, activity over all of them.
    session->start();
    send({{"issue_type", "underrun"}});
    send({{"issue_type", "overload"}}, AudioEventTypeError);
    send({{"issue_type", "overload"}}, AudioEventTypeError);
    EXPECT_EQ(shown(stopAndTakeSummary(), {"num_messages", "num_unique_messages", "num_redundant_messages",
                                           "active_count", "total_active_time", "overload_count"}),
              "3 3 0 2 6.5 3");
}

TEST_F(SummaryWorkerTest, TellsWhoReportedAndHowTheDeviceIs) {
    session->setServiceType(AudioServiceTypeTelephony);
    session->start();
    device.deviceConditions.lowPower = true;
    Dictionary summary = stopAndTakeSummary();
    EXPECT_EQ(shown(summary, {"summaryServiceName", "HostApplicationDisplayID", "clientProcessName",
                              "singleMessageSession", "thermal_state", "low_power_enabled",
                              "vmInfo_phys_footprint_MiB", "load_avg_1_min", "load_avg_5_min",
                              "load_avg_15_min", "audiotag"}),
              "\"telephony\" \"Unknown\" false \"Nominal\" 1 3 0.5 0.25 0.125 \"Session_GenericSummary\"");

    session->setClientProcessName("phone");
    session->updateConfigurationWithContentsOfConfiguration(
        {{"HostApplicationDisplayID", "com.example.phone"}});
    device.deviceConditions.lowPower = false;
    device.processInformation.footprint = (std::uint64_t{4} << 30U) + (std::uint64_t{3} << 20U) + 5;
    const std::pair<int, const char*> states[] = {
        {1, "\"Fair\""}, {2, "\"Serious\""}, {3, "\"Critical\""}, {4, "\"Unknown\""}, {-1, "\"Unknown\""}};
    for (const auto& [state, name] : states) {
        device.deviceConditions.thermal = state;
        session->start();
        summary = stopAndTakeSummary();
        EXPECT_EQ(shown(summary, {"HostApplicationDisplayID", "clientProcessName", "low_power_enabled",
                                  "vmInfo_phys_footprint_MiB", "thermal_state"}),
                  std::string("\"com.example.phone\" \"phone\" 0 3 ") + name);
    }

    device.processInformation.footprint = ProcessInformation::QueryError{2, "no such file"};
    device.log.clear();
    session->start();
    EXPECT_FALSE(stopAndTakeSummary().contains("vmInfo_phys_footprint_MiB"));
    EXPECT_THAT(
        device.log.lines(),
        Contains(AllOf(Field(&FakeLog::Line::level, LogLevel::error), Field(&FakeLog::Line::category, "zrru"),
                       Field(&FakeLog::Line::text, "Error with task_info(): no such file"))));
}

} // namespace
} // namespace tamblo
