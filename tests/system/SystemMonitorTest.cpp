#include "system/ZRReportingSystemMonitor.h"
#include "tests/workers/WorkerTest.h"

#include <cctype>
#include <optional>
#include <thread>

namespace tamblo {
namespace {

constexpr const char* kSpatial = "spatial-audio-accessory-feature";
constexpr const char* kRinger = "com.vandra.dashlo.ringerstate";

class SystemMonitorTest : public WorkerTest {
protected:
    /// The context's.
    std::shared_ptr<SystemMonitorDictionary> snapshot() {
        return ZRReportingSystemMonitor::getSystemMonitorDictionary(device.context());
    }
    std::shared_ptr<SystemMonitorDictionary> makeMonitor() {
        ZRReportingSystemMonitor::initializeWithQueue(device.context(), device.serverQueue());
        return snapshot();
    }
    /// By default a second later, so that the reading differs from the one before.
    void post(const std::string& name, std::uint64_t word, std::chrono::seconds later = 1s) {
        device.clock.advance(later);
        device.namedNotifications.post(name, word);
        (void)device.serverQueue().runAll();
    }
    /// The values that the session was sent, "@" when they were read and ">" when they were sent, in seconds.
    static std::string toldTo(const std::shared_ptr<ZRReportingSession>& listener) {
        std::string told;
        for (const MessageRef& message :
             listener != nullptr ? listener->messages() : std::vector<MessageRef>()) {
            const Dictionary& payload = message->payload();
            if (message->category() == 8 && message->type() == 5) {
                const auto time = [&payload](std::string_view key) {
                    return std::to_string(
                        std::lround(payload.find(key)->doubleValue() - secondsSince1970(kStart)));
                };
                told += shown(payload, {"device_name", "ringerstate"}) + "@" + time("last_updated") + ">" +
                        time("zrreporting_timestamp") + " ";
            }
        }
        return told;
    }
};

TEST_F(SystemMonitorTest, AStateHasTheValueAsItIsStoredAndWhenItWasRead) {
    const Value spatial(Dictionary{{"mode", "fixed"}});
    device.preferences.set(kSpatial, "com.vandra.dashlo", spatial);
    device.processInformation.uptime = std::chrono::duration<double>(99.5);
    EXPECT_EQ(makeMonitor()->find(kSpatial), (Dictionary{{kSpatial, spatial},
                                                         {"zrreporting_timestamp", device.clock.seconds()},
                                                         {"systemuptime_sec", 100}}));
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
}

TEST_F(SystemMonitorTest, OneForTheProcessUntilItIsReset) {
    EXPECT_EQ(snapshot(), nullptr);
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

    const auto first = snapshot();
    FakeSerialQueue other("other");
    ZRReportingSystemMonitor::initializeWithQueue(device.context(), other);
    EXPECT_EQ(snapshot(), first);
    device.namedNotifications.post(kRinger, 1);
    EXPECT_EQ(other.runAll(), 0U) << "the first queue runs the handler";
    ZRReportingSystemMonitor::reset(device.context()); // with a notification on its way
    EXPECT_EQ(device.namedNotifications.registrationCount(), 0U);
    const auto second = makeMonitor();
    post(kRinger, 1);
    EXPECT_TRUE(first->find("ringerstate").empty());
    EXPECT_FALSE(second->find("ringerstate").empty());
}

/// Notes each call, then does what the test wants, once.
struct Observer final : SystemMonitorDictionary::KeyObserver {
    Observer(std::string observerName, std::string& observerCalls)
        : name(std::move(observerName)), calls(observerCalls) {}
    void keyValueChanged(std::string_view) override {
        calls += name + " ";
        std::exchange(act, [] {})();
    }
    void observe(SystemMonitorDictionary& states, std::string_view key) {
        observation.emplace(states.addKeyObserver(*this, key));
    }

    const std::string name;
    std::string& calls;
    std::function<void()> act = [] {};
    std::optional<SystemMonitorDictionary::Observation> observation;
};

TEST(SystemMonitorDictionaryTest, ObserversMayComeAndGoWhileTheyAreCalled) {
    const auto states = std::make_shared<SystemMonitorDictionary>();
    std::string calls;
    Observer a("a", calls), b("b", calls), c("c", calls), late("late", calls), elsewhere("elsewhere", calls);
    states->set("key", {{"key", 0}}); // not told to those who come later
    for (Observer* observer : {&a, &b, &c}) {
        observer->observe(*states, "key");
    }
    elsewhere.observe(*states, "other");
    a.act = [&] {
        a.observation.reset();
        b.observation.reset();
        late.observe(*states, "key");
        EXPECT_EQ(states->find("key"), (Dictionary{{"key", 1}})) << "stored before it is told";
    };
    states->set("key", {{"key", 1}});
    EXPECT_EQ(calls, "a c ");
    c.act = [&] { states->set("key", {{"key", 3}}); };
    states->set("key", {{"key", 2}});
    EXPECT_EQ(calls, "a c c c late late ");
}

TEST(SystemMonitorDictionaryTest, EndingAnObservationWaitsForACallOnAnotherThread) {
    const auto states = std::make_shared<SystemMonitorDictionary>();
    std::string calls; // unguarded: the race detector watches
    for (int round = 0; round != 200; ++round) {
        auto observer = std::make_unique<Observer>("it", calls);
        observer->observe(*states, "key");
        std::thread storing([&] { states->set("key", {{"key", round}}); });
        observer.reset();
        storing.join();
    }
    EXPECT_EQ(states->observationCount(), 0U);
}

/// "a+" starts session a, "a-" stops it, "a!" drops it; a number is seconds, "=" sets the name. What each
/// session was told, then the observations that there are, and all messages.
TEST_F(SystemMonitorTest, SessionsAreToldWhatIsKnownAtTheStartAndEveryChangeAfter) {
    const Played cases[] = {
        {"the ringer once it was signalled; the same reading at the same time is no change",
         "monitor =den changed 10 a+ b+ ring again c+",
         R"(a "den"@1>11 true@12>12 b "den"@1>11 true@12>12 c "den"@1>12 true@12>12 : 9 6)"},
        {"preferences at once, the ringer not; names anew at their own notification",
         "=den ring monitor a+ =attic ring", R"(a "den"@1>1 true@2>2 : 3 2)"},
        {"a value that is gone leaves the previous state", "monitor =den changed unname changed a+",
         R"(a "den"@1>2 : 3 1)"},
        {"a stopped session hears nothing until it starts again", "monitor a+ b+ a- ring 3 a+ quiet",
         "a true@1>4 false@5>5 b true@1>1 false@5>5 : 6 4"},
        {"one that is dropped while it is started leaves nothing behind", "monitor a+ a! ring b+ quiet",
         "a b true@1>1 false@2>2 : 3 2"},
        {"workers keep the snapshot that they found, or none",
         "monitor ring a+ reset b+ monitor quiet 1 a- a+ c+", "a true@1>3 b c false@2>3 : 3 2"},
    };
    for (const auto& row : cases) {
        session.reset();
        device.restart();
        device.clock.set(kStart);
        device.preferences.remove("device_name", "com.vandra.tamblo");
        std::map<char, std::shared_ptr<ZRReportingSession>> sessions;
        playWords(
            row.script,
            {{"monitor", [this] { (void)makeMonitor(); }},
             {"reset", [this] { ZRReportingSystemMonitor::reset(device.context()); }},
             {"unname", [this] { device.preferences.remove("device_name", "com.vandra.tamblo"); }},
             {"changed", [this] { post("com.vandra.tamblo.reporting", 0); }},
             {"ring", [this] { post(kRinger, 1); }},
             {"again", [this] { post(kRinger, 1, 0s); }},
             {"quiet", [this] { post(kRinger, 0); }}},
            [&](const std::string& word) {
                if (std::isdigit(word.front()) != 0) {
                    device.clock.advance(std::chrono::seconds(std::stoi(word)));
                    return;
                }
                if (word.starts_with('=')) {
                    device.preferences.set("device_name", "com.vandra.tamblo", word.substr(1));
                    return;
                }
                std::shared_ptr<ZRReportingSession>& meant = sessions[word.front()];
                meant = meant == nullptr ? makeSession() : meant;
                word.back() == '+' ? meant->start() : word.back() == '-' ? meant->stop() : meant.reset();
            });
        std::string told;
        std::int64_t messages = 0;
        for (const auto& [name, listener] : sessions) {
            told += std::string(1, name) + " " + toldTo(listener);
            messages += listener != nullptr ? listener->totalMessageCount() : 0;
        }
        told += ": " + std::to_string(snapshot()->observationCount()) + " " + std::to_string(messages);
        EXPECT_EQ(told, row.expected) << row.what;
    }
}

} // namespace
} // namespace tamblo
