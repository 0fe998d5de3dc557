#include "session/ZRReportingSession.h"
#include "system/ZRReportingSystemMonitor.h"
#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"

#include <gmock/gmock.h>

#include <optional>
#include <string>
#include <thread>
#include <vector>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr const char* kSpatial = "spatial-audio-accessory-feature";
constexpr const char* kRinger = "com.vandra.dashlo.ringerstate";
constexpr const char* kReporting = "com.vandra.tamblo.reporting";

class SystemMonitorTest : public testing::Test {
protected:
    std::shared_ptr<SystemMonitorDictionary> makeMonitor() {
        ZRReportingSystemMonitor::initializeWithQueue(device.context(), device.serverQueue());
        return ZRReportingSystemMonitor::getSystemMonitorDictionary(device.context());
    }
    /// A second later, so that the reading differs from the one before; the time of the reading.
    double post(const std::string& name, std::uint64_t word) {
        device.clock.advance(std::chrono::seconds(1));
        device.namedNotifications.post(name, word);
        (void)device.serverQueue().runAll();
        return device.clock.seconds();
    }
    /// A feature's state as it would be read now.
    Dictionary stateNow(std::string_view feature, Value value) {
        return {{feature, std::move(value)},
                {"zrreporting_timestamp", device.clock.seconds()},
                {"systemuptime_sec", static_cast<int>(device.processInformation.uptime.count() + 0.5)}};
    }

    FakePlatform device;
};

TEST_F(SystemMonitorTest, ReadsPreferencesAtOnceAndTheRingerAtItsFirstNotification) {
    const Value spatial(Dictionary{{"mode", "fixed"}});
    device.preferences.set(kSpatial, "com.vandra.dashlo", spatial);
    device.preferences.set("device_name", "com.vandra.tamblo", 42);
    device.processInformation.uptime = std::chrono::duration<double>(99.5);
    device.namedNotifications.post(kRinger, 1); // before anybody listens
    const auto snapshot = makeMonitor();
    const Dictionary name = stateNow("device_name", 42);
    EXPECT_EQ(snapshot->find(kSpatial), stateNow(kSpatial, spatial));
    EXPECT_EQ(snapshot->find("device_name"), name) << "as it is stored";
    EXPECT_TRUE(snapshot->find("ringerstate").empty());
    device.preferences.set("device_name", "com.vandra.tamblo", "den");
    post(kRinger, 1);
    EXPECT_EQ(snapshot->find("ringerstate"), stateNow("ringerstate", true));
    EXPECT_EQ(snapshot->find("device_name"), name) << "read at its own notification alone";
    post(kReporting, 0);
    const Dictionary den = stateNow("device_name", "den");
    EXPECT_EQ(snapshot->find("device_name"), den);
    device.preferences.remove("device_name", "com.vandra.tamblo");
    post(kReporting, 0);
    EXPECT_EQ(snapshot->find("device_name"), den) << "a value that is gone leaves the previous state";
}

TEST_F(SystemMonitorTest, RingerIsOnForTheWordOneOnly) {
    const auto monitor = ZRReportingSystemMonitor::initWithQueue(device.services(), device.serverQueue());
    EXPECT_EQ(monitor->getFeatureState("ringerstate"), std::nullopt) << "never posted: the read fails";
    for (const std::uint64_t word : {1UL, 0UL, 2UL, UINT64_MAX, (1UL << 32U) + 1}) {
        post(kRinger, word);
        const Dictionary state = monitor->systemMonitorDictionary()->find("ringerstate");
        EXPECT_EQ(shown(state, {"ringerstate"}), word == 1 ? "true" : "false") << word;
    }
    EXPECT_EQ(monitor->getFeatureState("volume"), std::nullopt);
    monitor->clear();
    EXPECT_EQ(device.namedNotifications.registrationCount(), 0U);
    EXPECT_EQ(monitor->getFeatureState("ringerstate"), std::nullopt);
    EXPECT_FALSE(monitor->systemMonitorDictionary()->find("ringerstate").empty());
}

TEST_F(SystemMonitorTest, FailedRegistrationsAreLoggedAndNeverValued) {
    device.namedNotifications.registrationStatus = 7;
    device.preferences.set("device_name", "com.vandra.tamblo", "den");
    const auto monitor = ZRReportingSystemMonitor::initWithQueue(device.services(), device.serverQueue());
    EXPECT_EQ(device.log.count("notify setup result 7 token 0"), 3U);
    post(kRinger, 1);
    EXPECT_TRUE(monitor->systemMonitorDictionary()->find("ringerstate").empty());
    EXPECT_EQ(monitor->getFeatureState("ringerstate"), std::nullopt);
    EXPECT_FALSE(monitor->systemMonitorDictionary()->find("device_name").empty());
}

TEST_F(SystemMonitorTest, DefaultsAreReadOnce) {
    const auto make = [&] {
        return ZRReportingSystemMonitor::initWithQueue(device.services(), device.serverQueue());
    };
    const auto unset = make();
    device.preferences.set("device_name", "com.vandra.tamblo", 42);
    device.preferences.set("disable_reporting", "com.vandra.tamblo", "YES");
    EXPECT_EQ(unset->getDefaults(), (Dictionary{{"disable_reporting", false}}));
    EXPECT_EQ(make()->getDefaults(), (Dictionary{{"device_name", "42"}, {"disable_reporting", true}}));
}

TEST_F(SystemMonitorTest, OneForTheProcessUntilItIsReset) {
    EXPECT_EQ(ZRReportingSystemMonitor::getSystemMonitorDictionary(device.context()), nullptr);
    EXPECT_THAT(ZRReportingSystemMonitor::getSystemMonitorKeys(device.context()), IsEmpty());
    ZRReportingSystemMonitor::reset(device.context());
    {
        std::vector<std::jthread> makers;
        for (int i = 0; i != 4; ++i) {
            makers.emplace_back([this] { (void)makeMonitor(); });
        }
    }
    EXPECT_EQ(device.namedNotifications.registrationCount(), 3U);
    EXPECT_THAT(ZRReportingSystemMonitor::getSystemMonitorKeys(device.context()),
                ElementsAre("device_name", "ringerstate", kSpatial));

    const auto first = ZRReportingSystemMonitor::getSystemMonitorDictionary(device.context());
    FakeSerialQueue other("other");
    ZRReportingSystemMonitor::initializeWithQueue(device.context(), other);
    EXPECT_EQ(ZRReportingSystemMonitor::getSystemMonitorDictionary(device.context()), first);
    device.namedNotifications.post(kRinger, 1);
    EXPECT_EQ(other.runAll(), 0U);
    EXPECT_TRUE(first->find("ringerstate").empty()) << "the first queue runs the handler";

    ZRReportingSystemMonitor::reset(device.context()); // with a notification on its way
    EXPECT_EQ(device.namedNotifications.registrationCount(), 0U);
    const auto second = makeMonitor();
    post(kRinger, 1);
    EXPECT_TRUE(first->find("ringerstate").empty());
    EXPECT_FALSE(second->find("ringerstate").empty());
}

/// Notes each call, then does what the test wants.
struct Observer final : SystemMonitorDictionary::KeyObserver {
    Observer(std::string observerName, std::vector<std::string>& observerCalls)
        : name(std::move(observerName)), calls(observerCalls) {}
    void keyValueChanged(std::string_view) override {
        calls.push_back(name);
        if (act) {
            act();
        }
    }
    void observe(SystemMonitorDictionary& snapshot, std::string_view key) {
        observation.emplace(snapshot.addKeyObserver(*this, key));
    }

    std::string name;
    std::vector<std::string>& calls;
    std::function<void()> act;
    std::optional<SystemMonitorDictionary::Observation> observation;
};

TEST(SystemMonitorDictionaryTest, ObserversMayComeAndGoWhileTheyAreCalled) {
    const auto snapshot = std::make_shared<SystemMonitorDictionary>();
    std::vector<std::string> calls;
    Observer a("a", calls), b("b", calls), c("c", calls), late("late", calls), elsewhere("elsewhere", calls);
    snapshot->set("key", {{"key", 0}});
    a.observe(*snapshot, "key");
    b.observe(*snapshot, "key");
    c.observe(*snapshot, "key");
    elsewhere.observe(*snapshot, "other");
    EXPECT_THAT(calls, IsEmpty()) << "what stands there already is not told";

    a.act = [&] {
        a.observation.reset();
        b.observation.reset();
        late.observe(*snapshot, "key");
        EXPECT_EQ(snapshot->find("key"), (Dictionary{{"key", 1}})) << "stored before it is told";
    };
    snapshot->set("key", {{"key", 1}});
    EXPECT_THAT(std::exchange(calls, {}), ElementsAre("a", "c"));
    c.act = [&] {
        c.act = nullptr;
        snapshot->set("key", {{"key", 3}});
    };
    snapshot->set("key", {{"key", 2}});
    EXPECT_THAT(std::exchange(calls, {}), ElementsAre("c", "c", "late", "late"));

    c.observation.reset();
    late.observation.reset();
    const auto moved = std::move(*elsewhere.observation);
    elsewhere.observation.reset();
    EXPECT_EQ(snapshot->observationCount(), 1U);
    snapshot->set("other", {{"other", 1}});
    EXPECT_THAT(calls, ElementsAre("elsewhere"));
}

TEST(SystemMonitorDictionaryTest, EndingAnObservationWaitsForACallOnAnotherThread) {
    const auto snapshot = std::make_shared<SystemMonitorDictionary>();
    std::vector<std::string> calls; // unguarded: the race detector watches
    for (int round = 0; round != 200; ++round) {
        auto observer = std::make_unique<Observer>("it", calls);
        observer->observe(*snapshot, "key");
        std::thread storing([&] { snapshot->set("key", {{"key", round}}); });
        observer.reset();
        storing.join();
    }
    EXPECT_EQ(snapshot->observationCount(), 0U);
}

/// Sessions with their real workers beside a monitor.
class SystemMonitorWorkerTest : public SystemMonitorTest {
protected:
    SystemMonitorWorkerTest() { (void)makeMonitor(); }

    std::shared_ptr<ZRReportingSession> startedSession() {
        auto session = device.makeSession();
        session->start();
        return session;
    }
    /// The messages that the worker sent.
    static std::vector<Dictionary> sent(const std::shared_ptr<ZRReportingSession>& session) {
        std::vector<Dictionary> payloads;
        for (const MessageRef& message : session->messages()) {
            if (message->category() == 8 && message->type() == 5) {
                payloads.push_back(message->payload());
            }
        }
        return payloads;
    }
    /// A message of the worker's as the session keeps it, sent now.
    Dictionary message(std::string_view feature, Value value, double lastUpdated) {
        return {{feature, std::move(value)},
                {"last_updated", lastUpdated},
                {"zrreporting_timestamp", device.clock.seconds()},
                {"audiotag", "SetupSetup"},
                {"invalid_timestamp", "nil"}, // it comes without one
                {"HostApplicationDisplayID", "Unknown"}};
    }
    std::size_t observationCount() {
        return ZRReportingSystemMonitor::getSystemMonitorDictionary(device.context())->observationCount();
    }

    static constexpr std::size_t kObservations = 3; ///< of a started session
};

TEST_F(SystemMonitorWorkerTest, TellsWhatIsKnownAtTheStartAndEveryChangeAfter) {
    device.preferences.set("device_name", "com.vandra.tamblo", "den");
    const double named = post(kReporting, 0);
    device.clock.advance(std::chrono::seconds(10));
    const auto first = startedSession();
    EXPECT_THAT(sent(first), ElementsAre(message("device_name", "den", named)))
        << "the ringer has never been signalled";
    const auto second = startedSession();
    EXPECT_EQ(observationCount(), 2 * kObservations);

    const double signalled = post(kRinger, 1);
    const Dictionary ringer = message("ringerstate", true, signalled);
    for (const auto& session : {first, second}) {
        EXPECT_THAT(sent(session), ElementsAre(testing::_, ringer));
        EXPECT_EQ(session->previousValues().find("last_updated")->doubleValue(), signalled);
    }
    device.namedNotifications.post(kRinger, 1);
    (void)device.serverQueue().runAll();
    EXPECT_EQ(first->totalMessageCount(), 2) << "the same reading at the same time is no change";

    const auto third = startedSession();
    EXPECT_THAT(sent(third), testing::UnorderedElementsAre(message("device_name", "den", named), ringer));
    EXPECT_EQ(device.analyticsEvents.payloads("com.vandra.tamblo.Setup.Setup").size(), 6U)
        << "consumers see the messages like any other";
}

TEST_F(SystemMonitorWorkerTest, StoppedSessionHearsNothingUntilItStartsAgain) {
    const auto session = startedSession();
    const auto other = startedSession();
    session->stop();
    EXPECT_EQ(observationCount(), kObservations);
    const double signalled = post(kRinger, 1);
    EXPECT_EQ(session->totalMessageCount(), 0);
    EXPECT_EQ(other->totalMessageCount(), 1);
    device.clock.advance(std::chrono::seconds(3));
    session->start();
    EXPECT_THAT(sent(session), ElementsAre(message("ringerstate", true, signalled)));
    post(kRinger, 0);
    EXPECT_EQ(session->totalMessageCount(), 2);
}

TEST_F(SystemMonitorWorkerTest, SessionThatIsDroppedWhileStartedLeavesNothingBehind) {
    auto session = startedSession();
    const std::weak_ptr<ZRReportingSession> watched = session;
    session.reset();
    EXPECT_TRUE(watched.expired());
    EXPECT_EQ(observationCount(), 0U);
    post(kRinger, 1);
    const auto survivor = startedSession();
    post(kRinger, 0);
    EXPECT_EQ(survivor->totalMessageCount(), 2);
}

TEST_F(SystemMonitorWorkerTest, WorkersKeepTheSnapshotThatTheyFound) {
    const double signalled = post(kRinger, 1);
    const auto session = startedSession();
    ZRReportingSystemMonitor::reset(device.context());
    const auto between = startedSession();
    EXPECT_THAT(sent(between), IsEmpty()) << "no monitor, no features";
    (void)makeMonitor();
    post(kRinger, 0);
    EXPECT_EQ(session->totalMessageCount(), 1);
    EXPECT_EQ(between->totalMessageCount(), 0);
    EXPECT_EQ(observationCount(), 0U);
    session->stop();
    session->start();
    EXPECT_THAT(sent(session), ElementsAre(message("ringerstate", true, signalled)))
        << "the old monitor's last reading";
    EXPECT_EQ(sent(startedSession()).size(), 1U);
}

} // namespace
} // namespace tamblo
