#include "tests/workers/WorkerTest.h"

namespace tamblo {
namespace {

class SummaryWorkerTest : public WorkerTest {
protected:
    void sendIO(Dictionary payload, AudioEventType type = AudioEventTypeGeneric) {
        send(std::move(payload), AudioEventKindIO, type);
    }
    /// Stops the session; these values of its summary.
    std::string summary(std::initializer_list<std::string_view> keys) {
        device.analyticsEvents.clear();
        session->stop();
        const auto payloads = device.analyticsEvents.payloads("com.vandra.tamblo.Session_Generic.Summary");
        EXPECT_EQ(payloads.size(), 1U);
        return payloads.empty() ? "" : shown(payloads[0], keys);
    }
};

TEST_F(SummaryWorkerTest, CountsMessagesAndActivity) {
    const auto counts = [this] {
        return summary({"num_messages", "num_unique_messages", "num_redundant_messages", "active_count",
                        "total_active_time", "average_active_time", "overload_count"});
    };
    // Without a message, the session's own start and stop records are none; a stop that stops nothing leaves
    // one more of them in the list.
    session->stop();
    session->start();
    EXPECT_EQ(counts(), "0 0 0 0 0.0 0.0 0");

    // What a session is sent before its start counts to the run that follows.
    sendIO({{"n", 0}});
    session->start();
    session->start();
    for (const int n : {1, 2, 2, 2, 3}) {
        sendIO({{"n", n}});
    }
    sendIO({{"session_duration", 2.5}, {"issue_type", "overload"}});
    sendIO({{"session_duration", "4 seconds"}});
    sendIO({{"issue_type", "overload"}});
    sendIO({{"issue_type", "overload"}});
    EXPECT_EQ(counts(), "10 7 3 2 6.5 3.25 1");

    // Messages are counted by the run, activity over all of them.
    session->start();
    sendIO({{"issue_type", "underrun"}});
    sendIO({{"issue_type", "overload"}}, AudioEventTypeError);
    sendIO({{"issue_type", "overload"}}, AudioEventTypeError);
    EXPECT_EQ(counts(), "3 3 0 2 6.5 3.25 3");
}

TEST_F(SummaryWorkerTest, TellsWhoReportedAndHowTheDeviceIs) {
    session = makeSession(AudioServiceTypeTelephony);
    device.processInformation.footprint = (std::uint64_t{4} << 30U) + (std::uint64_t{3} << 20U) + 5;
    const std::pair<int, const char*> states[] = {{0, "Nominal"},  {1, "Fair"},    {2, "Serious"},
                                                  {3, "Critical"}, {4, "Unknown"}, {-1, "Unknown"}};
    for (const auto& [state, name] : states) {
        device.deviceConditions.thermal = state;
        device.deviceConditions.lowPower = state == 1;
        session->start();
        EXPECT_EQ(summary({"thermal_state", "low_power_enabled", "vmInfo_phys_footprint_MiB",
                           "load_avg_1_min", "load_avg_5_min", "load_avg_15_min", "summaryServiceName",
                           "HostApplicationDisplayID", "clientProcessName", "singleMessageSession"}),
                  std::string("\"") + name + (state == 1 ? "\" 1" : "\" 0") +
                      R"( 3 0.5 0.25 0.125 "telephony" "Unknown" "caller" false)");
    }
    session->setClientProcessName(std::nullopt);
    device.processInformation.footprint = ProcessInformation::QueryError{2, "no such file"};
    (void)logged(ZRReportingSummaryLogCategory());
    session->start();
    EXPECT_EQ(summary({"vmInfo_phys_footprint_MiB", "clientProcessName"}), "");
    EXPECT_EQ(loggedLevels(ZRReportingSummaryLogCategory()), "e");
}

} // namespace
} // namespace tamblo
