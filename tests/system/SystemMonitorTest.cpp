#include "system/ZRReportingSystemMonitor.h"
#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/FakeSerialQueue.h"

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
    void post(const std::string& name, std::uint64_t word) {
        device.namedNotifications.post(name, word);
        (void)device.serverQueue().runAll();
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
    device.log.clear();
    device.clock.advance(std::chrono::seconds(5));
    device.preferences.set("device_name", "com.vandra.tamblo", "den");
    post(kRinger, 1);
    EXPECT_EQ(snapshot->find("ringerstate"), stateNow("ringerstate", true));
    EXPECT_EQ(snapshot->find("device_name"), name) << "read at its own notification alone";
    EXPECT_THAT(device.log.texts(), ElementsAre("feature changes featureName=ringerstate token=2",
                                                "getting feature ringerstate"));
    post(kReporting, 0);
    const Dictionary den = stateNow("device_name", "den");
    EXPECT_EQ(snapshot->find("device_name"), den);
    device.preferences.remove("device_name", "com.vandra.tamblo");
    device.clock.advance(std::chrono::seconds(1));
    post(kReporting, 0);
    EXPECT_EQ(snapshot->find("device_name"), den) << "a value that is gone leaves the previous state";
}

TEST_F(SystemMonitorTest, RingerIsOnForTheWordOneOnly) {
    const auto monitor = ZRReportingSystemMonitor::initWithQueue(device.services(), device.serverQueue());
    EXPECT_EQ(monitor->getFeatureState("ringerstate"), std::nullopt) << "never posted: the read fails";
    for (const std::uint64_t word :
         {std::uint64_t{1}, std::uint64_t{0}, std::uint64_t{2}, UINT64_MAX, (std::uint64_t{1} << 32U) + 1}) {
        post(kRinger, word);
        const Dictionary state = monitor->systemMonitorDictionary()->find("ringerstate");
        ASSERT_NE(state.find("ringerstate"), nullptr) << word;
        EXPECT_EQ(state.find("ringerstate")->kind(), Value::Kind::boolean);
        EXPECT_EQ(state.find("ringerstate")->boolValue(), word == 1) << word;
    }
    EXPECT_EQ(monitor->getFeatureState("volume"), std::nullopt);
    EXPECT_EQ(monitor->getFeatureState(""), std::nullopt);
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
    EXPECT_EQ(monitor->features().find("ringerstate")->dictionaryValue().find("notify_token")->integerValue(),
              0);
    post(kRinger, 1);
    EXPECT_TRUE(monitor->systemMonitorDictionary()->find("ringerstate").empty());
    EXPECT_EQ(monitor->getFeatureState("ringerstate"), std::nullopt);
    EXPECT_FALSE(monitor->systemMonitorDictionary()->find("device_name").empty());
}

TEST_F(SystemMonitorTest, DefaultsAreReadOnce) {
    const auto unset = ZRReportingSystemMonitor::initWithQueue(device.services(), device.serverQueue());
    EXPECT_EQ(unset->getDefaults(), (Dictionary{{"disable_reporting", false}}));
    device.preferences.set("device_name", "com.vandra.tamblo", 42);
    device.preferences.set("disable_reporting", "com.vandra.tamblo", "YES");
    EXPECT_EQ(unset->getDefaults(), (Dictionary{{"disable_reporting", false}}));
    const Dictionary set =
        ZRReportingSystemMonitor::initWithQueue(device.services(), device.serverQueue())->getDefaults();
    EXPECT_EQ(set, (Dictionary{{"device_name", "42"}, {"disable_reporting", true}}));
    EXPECT_EQ(set.find("disable_reporting")->kind(), Value::Kind::boolean);
}

TEST_F(SystemMonitorTest, OneForTheProcessUntilItIsReset) {
    EXPECT_EQ(ZRReportingSystemMonitor::getSystemMonitorDictionary(device.context()), nullptr);
    EXPECT_THAT(ZRReportingSystemMonitor::getSystemMonitorKeys(device.context()), IsEmpty());
    ZRReportingSystemMonitor::reset(device.context());
    std::vector<std::thread> makers;
    for (int i = 0; i != 4; ++i) {
        makers.emplace_back([this] { (void)makeMonitor(); });
    }
    for (std::thread& maker : makers) {
        maker.join();
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
    EXPECT_NE(second, first);
    post(kRinger, 1);
    EXPECT_TRUE(first->find("ringerstate").empty());
    EXPECT_FALSE(second->find("ringerstate").empty());
}

/// Notes each call, then does what the test wants.
struct Observer final : SystemMonitorDictionary::KeyObserver {
    Observer(std::string observerName, std::vector<std::string>& observerCalls)
        : name(std::move(observerName)), calls(observerCalls) {}
    void keyValueChanged(std::string_view key) override {
        calls.push_back(name + " " + std::string(key));
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
    Observer a("a", calls);
    Observer b("b", calls);
    Observer c("c", calls);
    Observer late("late", calls);
    Observer elsewhere("elsewhere", calls);
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
    EXPECT_THAT(std::exchange(calls, {}), ElementsAre("a key", "c key"));
    c.act = [&] {
        c.act = nullptr;
        snapshot->set("key", {{"key", 3}});
    };
    snapshot->set("key", {{"key", 2}});
    EXPECT_THAT(std::exchange(calls, {}), ElementsAre("c key", "c key", "late key", "late key"));

    c.observation.reset();
    late.observation.reset();
    const auto moved = std::move(*elsewhere.observation);
    elsewhere.observation.reset();
    EXPECT_EQ(snapshot->observationCount(), 1U);
    snapshot->set("other", {{"other", 1}});
    EXPECT_THAT(calls, ElementsAre("elsewhere other"));
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

} // namespace
} // namespace tamblo
