#include "system/ZRReportingSessionDriverSnapshotWorker.h"
#include "system/ZRReportingSystemMonitor.h"
#include "tests/workers/WorkerTest.h"

#include <cctype>
#include <thread>

// What sessions are told of the system: its settings and its drivers.

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
    static std::string toldTo(ZRReportingSession& listener) {
        std::string told;
        for (const MessageRef& message : listener.messages()) {
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

TEST_F(SystemMonitorTest, AStateHasTheValueAndWhenItWasReadAndTheRingerIsOnForTheWordOneOnly) {
    device.preferences.setPreferenceValue(kSpatial, "com.vandra.dashlo", "fixed");
    const auto states = makeMonitor();
    EXPECT_EQ(states->find(kSpatial), (Dictionary{{kSpatial, "fixed"},
                                                  {"zrreporting_timestamp", device.clock.seconds()},
                                                  {"systemuptime_sec", 1000}}));
    for (const std::uint64_t word : {1UL, 0UL, 2UL, UINT64_MAX, (1UL << 32U) + 1}) {
        post(kRinger, word);
        EXPECT_EQ(shown(states->find("ringerstate"), {"ringerstate"}), word == 1 ? "true" : "false") << word;
    }
}

TEST_F(SystemMonitorTest, OneForTheProcessUntilItIsReset) {
    EXPECT_EQ(snapshot(), nullptr);
    ZRReportingSystemMonitor::reset(device.context());
    (void)makeMonitor();
    const auto first = makeMonitor();
    EXPECT_EQ(device.namedNotifications.registrationCount(), 3U);
    device.namedNotifications.post(kRinger, 1);
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
    Observer a("a", calls), b("b", calls), c("c", calls), late("late", calls);
    states->set("key", {{"key", 0}}); // not told to those who come later
    for (Observer* observer : {&a, &b, &c}) {
        observer->observe(*states, "key");
    }
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
        {"a stopped session hears nothing until it starts again", "monitor a+ b+ a- ring 3 a+ quiet",
         "a true@1>4 false@5>5 b true@1>1 false@5>5 : 6 4"},
        {"one that is dropped while it is started leaves nothing behind", "monitor a+ a! ring b+ quiet",
         "b true@1>1 false@2>2 : 3 2"},
        {"workers keep the snapshot that they found, or none",
         "monitor ring a+ reset b+ monitor quiet 1 a- a+ c+", "a true@1>3 b c false@2>3 : 3 2"},
    };
    for (const auto& row : cases) {
        session.reset();
        device.restart();
        device.clock.set(kStart);
        device.preferences.values.erase({"com.vandra.tamblo", "device_name"});
        std::map<char, std::shared_ptr<ZRReportingSession>> sessions;
        playWords(row.script,
                  {{"monitor", [this] { (void)makeMonitor(); }},
                   {"reset", [this] { ZRReportingSystemMonitor::reset(device.context()); }},
                   {"changed", [this] { post("com.vandra.tamblo.reporting", 0); }},
                   {"ring", [this] { post(kRinger, 1); }},
                   {"again", [this] { post(kRinger, 1, 0s); }},
                   {"quiet", [this] { post(kRinger, 0); }},
                   {"a!", [&sessions] { sessions.erase('a'); }}},
                  [&](const std::string& word) {
                      if (std::isdigit(word.front()) != 0) {
                          device.clock.advance(std::chrono::seconds(std::stoi(word)));
                          return;
                      }
                      if (word.starts_with('=')) {
                          device.preferences.setPreferenceValue("device_name", "com.vandra.tamblo",
                                                                word.substr(1));
                          return;
                      }
                      std::shared_ptr<ZRReportingSession>& meant = sessions[word.front()];
                      meant = meant == nullptr ? makeSession() : meant;
                      word.back() == '+' ? meant->start() : meant->stop();
                  });
        std::string told;
        std::int64_t messages = 0;
        for (const auto& [name, listener] : sessions) {
            told += std::string(1, name) + " " + toldTo(*listener);
            messages += listener->totalMessageCount();
        }
        told += ": " + std::to_string(snapshot()->observationCount()) + " " + std::to_string(messages);
        EXPECT_EQ(told, row.expected) << row.what;
    }
}

using Utility = ZRReportingDriverUtility;
using Name = std::optional<std::string>;

ChanlogChannel channelOf(ChanlogFormat format, Name group, Name subGroup = {}, Name name = "n") {
    ChanlogChannel channel;
    channel.format = format;
    channel.groupName = std::move(group);
    channel.subGroupName = std::move(subGroup);
    channel.channelName = std::move(name);
    return channel;
}
ChanlogChannel simple(std::int64_t value, Name group, Name subGroup = {}, Name name = "n") {
    auto channel = channelOf(ChanlogFormat::simple, std::move(group), std::move(subGroup), std::move(name));
    channel.value = value;
    return channel;
}

class DriverStatisticsTest : public WorkerTest {
protected:
    /// What sessions were sent of the drivers, without what every message has.
    std::vector<std::string> sent() {
        std::vector<std::string> found;
        for (const auto& event : device.analyticsEvents.events) {
            Dictionary payload = event.payload;
            for (const char* key :
                 {"HostApplicationDisplayID", "audiotag", "invalid_timestamp", "zrreporting_timestamp"}) {
                payload.remove(key);
            }
            if (event.name.starts_with("com.vandra.tamblo.Chanlog.")) {
                found.push_back(event.name.substr(26) + jsonText(payload));
            }
        }
        return found;
    }
};

TEST_F(DriverStatisticsTest, TheFirstStartSubscribesToTheGroupsThatThereAre) {
    device.chanlog.channels = {simple(1, "Speaker"), simple(1, "x", "MCA"), simple(1, "Haptics"),
                               simple(1, "Haptics", "Stats")};
    makeSession()->start();
    EXPECT_EQ(device.chanlog.calls, "|VandraAE2MCA- Speaker- -MCA Haptics-Stats StateTransitionTimes_ms- Rx- "
                                    "Tx- -VXA2 pdm- |sss");
    device.chanlog.channels.push_back(simple(1, "pdm"));
    device.chanlog.calls.clear();
    makeSession()->start();
    EXPECT_EQ(device.chanlog.calls, "|sss") << "a group that comes later is not asked for";
}

TEST_F(DriverStatisticsTest, ADriverThatFailsIsAbsent) {
    FakeChanlogFacility& chanlog = device.chanlog;
    chanlog.channels = {simple(5, "Speaker")};
    for (const auto error : {&FakeChanlogFacility::channelsError, &FakeChanlogFacility::subscribeError}) {
        chanlog.*error = 13;
        EXPECT_THAT(Utility(chanlog).ioChannelSubscriptions(), IsEmpty());
        (chanlog.*error).reset();
    }
    EXPECT_EQ(device.log.count("error 13 "), 10U) << "for each of nine drivers, and the one that is there";
    const Utility utility(chanlog);
    const Utility::DriverSnapShot empty;
    for (const std::optional<int> error : {std::optional(15), std::optional<int>()}) {
        chanlog.sampleError = error;
        EXPECT_EQ(utility.getSnapShot().empty(), error.has_value());
        utility.sendDriverLogsForSession(session, &empty);
    }
    utility.sendDriverLogsForSession(session, nullptr);
    EXPECT_EQ(device.log.count("ChanlogCreateSamples error"), 3U) << "two, and no sample to compare with";
    EXPECT_EQ(session->totalMessageCount(), 0);
}

TEST_F(DriverStatisticsTest, AStopSendsWhatWasGainedKindByKind) {
    ChanlogChannel histogram = channelOf(ChanlogFormat::histogram, "Speaker", "Thermal Zone_1", "coil temp");
    histogram.driverName = "Speaker_Amp<2><3>";
    histogram.unitLabel = "C";
    histogram.buckets = {{.lower = -9, .upper = -5, .hits = 3},
                         {.lower = -5, .upper = -4, .hits = 0},
                         {.lower = -4, .upper = -1, .hits = 2}};
    histogram.minimum = -8;
    histogram.maximum = -1;
    ChanlogChannel state = channelOf(ChanlogFormat::state, "Speaker", {}, "power");
    state.states = {{.name = "off", .transitions = 2, .residency = 0, .dutyCycle = 0},
                    {.name = "on", .transitions = 1, .residency = UINT64_MAX, .dutyCycle = 1.0 / 3},
                    {.name = "low", .transitions = 0, .residency = 1, .dutyCycle = 2.0 / 3}};
    device.chanlog.channels = {state,
                               histogram,
                               simple(4, "Speaker<1>", "MCA", "a_b <c>"),
                               simple(7, {}, "MCA", {}),
                               simple(0, "Speaker", {}, "idle"),
                               channelOf(ChanlogFormat::invalid, "Speaker"),
                               channelOf(ChanlogFormat::simpleArray, "Speaker", "s"),
                               channelOf(static_cast<ChanlogFormat>(200), "Speaker")};
    session->start();
    device.chanlog.calls.clear();
    session->stop();
    EXPECT_EQ(device.chanlog.calls, "|sdsd") << "one pass";
    EXPECT_THAT(sent(), ElementsAre(R"(Simple{"MCA_Simple_":7,"Speaker<1>_MCA_Simple_ab<c>":4})",
                                    R"(Histogram{"SpeakerAmp_Speaker_ThermalZone1_Histogram_coiltemp":)"
                                    R"("count=3,lower=-9,upper=0,min=-8,max=-1,unit=C::-9--5:3;-4--1:2"})",
                                    R"(State{"Speaker_State_power":"name:on,transition:1,)"
                                    R"(residency:18446744073709551615,duty_cycle:0.333333;)"
                                    R"(name:low,transition:0,residency:1,duty_cycle:0.666667;"})"));

    device.analyticsEvents.events.clear();
    state.states.resize(1);
    histogram.buckets.resize(2);
    histogram.buckets[0].hits = 0;
    device.chanlog.channels = {simple(0, "Speaker"), simple(-4, "Speaker", {}, "m"), state, histogram};
    session->start();
    session->stop();
    EXPECT_THAT(sent(), IsEmpty()) << "nothing moved, nothing is sent";
}

} // namespace
} // namespace tamblo
