#include "base/Json.h"
#include "session/ZRReportingSession.h"
#include "system/ZRReportingSystemMonitor.h"
#include "tests/fakes/FakePlatform.h"

#include <gmock/gmock.h>

#include <string>
#include <vector>

namespace tamblo {
namespace {

using std::chrono::seconds;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr const char* kRinger = "com.vandra.dashlo.ringerstate";
constexpr const char* kReporting = "com.vandra.tamblo.reporting";
constexpr std::size_t kObservations = 3; ///< of a started session

/// Sessions with their real workers beside a monitor.
class SystemMonitorWorkerTest : public testing::Test {
protected:
    SystemMonitorWorkerTest() {
        ZRReportingSystemMonitor::initializeWithQueue(device.context(), device.serverQueue());
    }

    std::shared_ptr<ZRReportingSession> startedSession(ReporterID reporterID) {
        auto session = device.makeSession(reporterID, {100});
        session->start();
        return session;
    }
    /// A second later, so that the reading differs from the one before.
    void post(const std::string& name, std::uint64_t word) {
        device.clock.advance(seconds(1));
        device.namedNotifications.post(name, word);
        (void)device.serverQueue().runAll();
    }
    /// The messages that the worker sent, as JSON.
    static std::vector<std::string> sent(const std::shared_ptr<ZRReportingSession>& session) {
        std::vector<std::string> payloads;
        for (const MessageRef& message : session->messages()) {
            if (message->category() == 8 && message->type() == 5) {
                payloads.push_back(jsonText(message->payload()));
            }
        }
        return payloads;
    }
    /// A message of the worker's as the session keeps it, sent now.
    std::string message(std::string_view feature, Value value, double lastUpdated) {
        return jsonText(Dictionary{{feature, std::move(value)},
                                   {"last_updated", lastUpdated},
                                   {"zrreporting_timestamp", device.clock.seconds()},
                                   {"audiotag", "SetupSetup"},
                                   {"invalid_timestamp", "nil"}, // it comes without one
                                   {"HostApplicationDisplayID", "Unknown"}});
    }
    std::size_t observationCount() {
        return ZRReportingSystemMonitor::getSystemMonitorDictionary(device.context())->observationCount();
    }

    FakePlatform device{LogLevel::fault};
};

TEST_F(SystemMonitorWorkerTest, TellsWhatIsKnownAtTheStartAndEveryChangeAfter) {
    device.preferences.set("device_name", "com.vandra.tamblo", "den");
    post(kReporting, 0);
    const double named = device.clock.seconds();
    device.clock.advance(seconds(10));
    const auto first = startedSession(1);
    EXPECT_THAT(sent(first), ElementsAre(message("device_name", "den", named)))
        << "the ringer has never been signalled";
    const auto second = startedSession(2);
    EXPECT_EQ(observationCount(), 2 * kObservations);

    post(kRinger, 1);
    const double signalled = device.clock.seconds();
    const std::string ringer = message("ringerstate", true, signalled);
    for (const auto& session : {first, second}) {
        ASSERT_EQ(sent(session).size(), 2U);
        EXPECT_EQ(sent(session)[1], ringer);
        EXPECT_EQ(session->previousValues().find("last_updated")->doubleValue(), signalled);
    }
    device.namedNotifications.post(kRinger, 1);
    (void)device.serverQueue().runAll();
    EXPECT_EQ(first->totalMessageCount(), 2) << "the same reading at the same time is no change";

    const auto third = startedSession(3);
    EXPECT_THAT(sent(third), testing::UnorderedElementsAre(message("device_name", "den", named), ringer));
    EXPECT_EQ(device.analyticsEvents.payloads("com.vandra.tamblo.Setup.Setup").size(), 6U)
        << "consumers see the messages like any other";
}

TEST_F(SystemMonitorWorkerTest, StoppedSessionHearsNothingUntilItStartsAgain) {
    const auto session = startedSession(1);
    const auto other = startedSession(2);
    session->stop();
    EXPECT_EQ(observationCount(), kObservations);
    post(kRinger, 1);
    const double signalled = device.clock.seconds();
    EXPECT_EQ(session->totalMessageCount(), 0);
    EXPECT_EQ(other->totalMessageCount(), 1);
    device.clock.advance(seconds(3));
    session->start();
    EXPECT_THAT(sent(session), ElementsAre(message("ringerstate", true, signalled)));
    post(kRinger, 0);
    EXPECT_EQ(session->totalMessageCount(), 2);
}

TEST_F(SystemMonitorWorkerTest, SessionThatIsDroppedWhileStartedLeavesNothingBehind) {
    auto session = startedSession(1);
    const std::weak_ptr<ZRReportingSession> watched = session;
    session.reset();
    EXPECT_TRUE(watched.expired());
    EXPECT_EQ(observationCount(), 0U);
    post(kRinger, 1);

    const auto survivor = startedSession(3);
    device.analyticsEvents.clear();
    post(kRinger, 0);
    EXPECT_EQ(device.analyticsEvents.payloads("com.vandra.tamblo.Setup.Setup").size(), 1U);
    EXPECT_EQ(survivor->totalMessageCount(), 2);
    EXPECT_EQ(observationCount(), kObservations);
}

TEST_F(SystemMonitorWorkerTest, WorkersKeepTheSnapshotThatTheyFound) {
    post(kRinger, 1);
    const auto session = startedSession(1);
    ZRReportingSystemMonitor::reset(device.context());
    const auto between = startedSession(2);
    EXPECT_THAT(sent(between), IsEmpty()) << "no monitor, no features";
    ZRReportingSystemMonitor::initializeWithQueue(device.context(), device.serverQueue());
    post(kRinger, 0);
    EXPECT_EQ(session->totalMessageCount(), 1);
    EXPECT_EQ(between->totalMessageCount(), 0);
    EXPECT_EQ(observationCount(), 0U);
    session->stop();
    session->start();
    EXPECT_THAT(sent(session), ElementsAre(testing::HasSubstr(R"("ringerstate":true)")))
        << "the old monitor's last reading";
    EXPECT_EQ(sent(startedSession(3)).size(), 1U);
}

} // namespace
} // namespace tamblo
