#include "base/Format.h"
#include "tests/workers/WorkerTest.h"
#include "workers/sinks/ZRReportingSessionZephWorker.h"

#include <optional>
#include <thread>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using namespace std::chrono_literals;

constexpr const char* kHapticKey = "Haptic_Active_Hardware_Time_Seconds";
constexpr const char* kSoundKey = "System_Sound_Stuck_Time_Seconds";
const Dictionary kLow{{"issue_type", "LowRMS"}};
const Dictionary kOpened{{"success", true}, {"session_id", "S-1"}};

/// Interested in whatever has a number; keeps what happens to it.
class ScriptedDetector final : public ZRReportingSessionZephWorkerInstance {
public:
    using ZRReportingSessionZephWorkerInstance::ZRReportingSessionZephWorkerInstance;
    [[nodiscard]] bool interestedInMessage(const ZRReportingSessionMessage& message) const override {
        return message.payload().contains("n");
    }
    void start() override { calls += 's'; }
    [[nodiscard]] bool canFire() const noexcept override { return doesFire; }
    void fire(const ZRReportingSessionMessage&) override { calls += 'F'; }
    void handleMessage(const ZRReportingSessionMessage&) override { calls += '.'; }
    void stop() override { calls += 'e'; }

    static inline bool doesFire = true;
    static inline std::string calls;
};

class ZephWorkerTest : public WorkerTest {
protected:
    ZephWorkerTest() : WorkerTest(LogLevel::debug, true) {}

    void startSession(AudioServiceType type, bool isSingle = false) {
        session = makeSession(type);
        session->setIsSingleMessageSession(isSingle);
        session->start();
    }
    void sendLeak(const char* key, std::chrono::nanoseconds wait = 1ms) {
        device.clock.advance(wait);
        send({{key, 90}}, AudioEventKindPlayback, AudioEventTypeJoulery);
    }
    void sendLow(int times = 3) {
        for (int i = 0; i < times; ++i) {
            device.clock.advance(1ms);
            send(kLow, AudioEventKindError, AudioEventTypeIssueDetector);
        }
    }
    /// What was asked of the capture service since the last call.
    std::vector<std::string> asked() {
        std::vector<std::string> found;
        for (const auto& [operation, processes, filed, duration, payload, identifier] :
             std::exchange(device.bugCapture.requests, {})) {
            EXPECT_THAT(processes, ElementsAre(kClient, kOtherClient));
            found.push_back(operation == "cancel"
                                ? "cancel " + identifier
                                : formatted("{} {}/{}/{}/{}/{} {} {}", operation, filed.domain, filed.type,
                                            filed.subType, filed.subTypeContext, filed.detectedProcess,
                                            duration.count(), jsonText(payload)));
        }
        return found;
    }
    std::string snapshotOf(const char* what) {
        return formatted("snapshot Tonmetry/{}/Playback/Joulery/Unknown 0.000000 ", what) +
               R"({"diagnostic_extension_parameters":)"
               R"({"com.vandra.powerlog.systemlog.filterprocess":{"processIDs":[77,78]}}})";
    }
};

TEST_F(ZephWorkerTest, DetectorsFireAtTheirThresholdsAndBeginAnew) {
    const struct {
        std::optional<std::uint64_t> count; ///< without one, the state's own
        std::optional<std::chrono::duration<double>> duration;
        std::vector<std::pair<std::chrono::nanoseconds, int>> steps; ///< wait, number; 0: of no interest
        std::string calls;
        int fired;
        bool once = false;
        bool doesFire = true;
        AudioServiceType serviceType = AudioServiceTypeAlarms;
    } cases[] = {
        {3, {}, {{0s, 1}, {0s, 2}, {0s, 3}, {0s, 4}, {0s, 5}, {0s, 6}, {0s, 7}}, "...F...F.", 2},
        {2, {}, {{0s, 1}, {9s, 1}, {0s, 0}, {0s, 2}, {0s, 2}, {0s, 1}}, "..F..F", 2}, // repeats
        {0, 10s, {{0s, 1}, {10s, 2}, {1ns, 3}, {9s, 4}, {11s, 5}}, "...F..F", 2},
        {0, 10s, {{0s, 1}, {-99s, 2}, {109s, 3}, {1ns, 4}}, "....F", 1}, // the clock steps back
        {0, {}, {{0s, 1}, {9999h, 2}}, "..", 0},
        {{}, 1s, {{0s, 1}, {99s, 2}}, "..", 0},
        {1, 1s, {{0s, 1}, {0s, 2}, {0s, 2}, {0s, 3}}, ".F..", 1, true},
        {1, {}, {{0s, 1}, {0s, 2}}, "..", 0, false, false},
        {1, {}, {{0s, 1}, {0s, 2}}, "..", 2, false, true, AudioServiceTypeTest},
    };
    static std::shared_ptr<WorkerInstanceState> state;
    constexpr ZephWorkerInstanceClass scripted{
        .name = "Scripted",
        .messageType = AudioEventTypeState,
        .initWithSession = [](Context& context,
                              const auto& owner) -> std::unique_ptr<ZRReportingSessionZephWorkerInstance> {
            auto detector = std::make_unique<ScriptedDetector>(context, owner);
            detector->setWorkerState(state);
            return detector;
        }};
    for (const auto& row : cases) {
        state = std::make_shared<WorkerInstanceState>();
        state->interestThresholdCount = row.count.value_or(state->interestThresholdCount);
        state->interestThresholdDurationSeconds =
            row.duration.value_or(state->interestThresholdDurationSeconds);
        state->oncePerSession = row.once;
        ScriptedDetector::doesFire = row.doesFire;
        ScriptedDetector::calls.clear();
        device.bugCapture.reportersMade = 0;
        startSession(row.serviceType);
        const auto worker = make<ZRReportingSessionZephWorker>();
        worker->addInstance(scripted);
        EXPECT_EQ(worker->start(), true);
        for (const auto& [wait, number] : row.steps) {
            device.clock.advance(wait);
            worker->handleMessage(messageOf({{number != 0 ? "n" : "m", number}}, 4, AudioEventTypeState));
            worker->handleMessage(messageOf({{"n", -number}}, 4, AudioEventTypeHistogram));
        }
        worker->stop();
        EXPECT_EQ(ScriptedDetector::calls, "s" + row.calls + "e");
        EXPECT_EQ(device.bugCapture.reportersMade, row.fired) << row.calls;
    }
    state.reset();
}

TEST_F(ZephWorkerTest, EachDetectorLooksAtItsOwnMessages) {
    device.deviceProperties.set("HapticLeakCapture", true);
    const struct {
        AudioServiceType service;
        AudioEventType type;
        AudioEventCategory category;
        Dictionary payload;
        std::string interested;
        bool isSingle = false;
    } cases[] = {
        {4, 8, 4, {{kHapticKey, "x"}, {kSoundKey, false}}, "HapticLeaks SSSLeaks "},
        {4, 8, 4, {{kHapticKey, 1}, {kSoundKey, 1}}, "HapticLeaks SSSLeaks ", true},
        {2, 8, 0xFFFFFFFF, {{kSoundKey, 1}}, "SSSLeaks "},
        {4, 7, 11, {{kHapticKey, 1}, {kSoundKey, 1}}, ""},
        {4, 8, 11, kLow, ""},
        {4, 7, 11, kLow, "AlarmLowRMS "},
        {11, 7, 11, kLow, "AlarmLowRMS "},
        {4, 7, 11, kLow, "", true},
        {2, 7, 11, kLow, ""},
        {4, 7, 0x0800000B, kLow, ""},
        {4, 6, 11, kLow, ""},
        {4, 7, 11, {{"issue_type", "lowRMS"}}, ""},
    };
    const std::string beginning = "Interested in message. instance=ZRReportingZephWorkerInstance";
    for (const auto& row : cases) {
        startSession(row.service, row.isSingle);
        device.log.clear();
        device.clock.advance(1s);
        send(row.payload, row.category, row.type);
        std::string interested;
        for (const std::string& line : device.log.texts(beginning)) {
            interested += line.substr(beginning.size(), line.find(',') - beginning.size()) + " ";
        }
        EXPECT_EQ(interested, row.interested) << row.type << jsonText(row.payload);
    }
}

TEST_F(ZephWorkerTest, LeaksOfHapticsAreCountedOverSessionsAndRepeats) {
    startSession(AudioServiceTypeAlerts);
    sendLeak(kHapticKey); // counted by nobody
    device.deviceProperties.set("HapticLeakCapture", true);
    startSession(AudioServiceTypeAlerts);
    sendLeak(kHapticKey);
    startSession(AudioServiceTypeTelephony);
    EXPECT_THAT(asked(), IsEmpty());
    sendLeak(kHapticKey);
    EXPECT_THAT(asked(), ElementsAre(snapshotOf("haptics")));
    (void)logged(ZRReportingZephLogCategory());
    device.bugCapture.accepts = false;
    sendLeak(kHapticKey);
    sendLeak(kHapticKey);
    EXPECT_THAT(asked(), ElementsAre(snapshotOf("haptics")));
    EXPECT_EQ(loggedLevels(ZRReportingZephLogCategory()), "e");
    EXPECT_EQ(session->acceptedMessageCount(), 1U); // the others repeated it
}

TEST_F(ZephWorkerTest, StuckSystemSoundsAreCapturedOnceInFifteenSeconds) {
    const std::pair<std::chrono::nanoseconds, std::size_t> steps[] = {
        {0s, 1}, {15s - 1ns, 0}, {1ns, 1}, {10s, 0}, {5s, 1}};
    for (const auto& [wait, captures] : steps) {
        startSession(AudioServiceTypeAlerts);
        sendLeak(kSoundKey, wait);
        EXPECT_EQ(asked(), std::vector<std::string>(captures, snapshotOf("systemsounds")));
    }
}

TEST_F(ZephWorkerTest, StopCancelsTheCaptureOfALowAlarm) {
    const std::string start = "start Tonmetry/alarms/Error/IssueDetector/caller 60.000000 {}";
    startSession(AudioServiceTypeAlarms);
    sendLow(2);
    session->stop();
    session->start();
    EXPECT_THAT(asked(), IsEmpty());
    sendLow(4);      // once only
    session->stop(); // not answered yet: nothing to cancel
    device.bugCapture.answer(kOpened);
    EXPECT_THAT(asked(), ElementsAre(start));
    for (int round = 0; round < 2; ++round) {
        session->start();
        sendLow();
        session->stop();
        EXPECT_THAT(asked(), ElementsAre("cancel S-1"));
    }
    startSession(AudioServiceTypeAlarms);
    device.bugCapture.promptAnswer = Dictionary{{"reason", 1}};
    sendLow();
    session->stop();
    EXPECT_THAT(asked(), ElementsAre(start, "cancel NONE_RETURNED"));
    startSession(AudioServiceTypeAlarms);
    (void)logged(ZRReportingZephLogCategory());
    device.bugCapture.accepts = false;
    sendLow();
    session->stop();
    EXPECT_THAT(asked(), ElementsAre(start));
    EXPECT_EQ(loggedLevels(ZRReportingZephLogCategory()), "e");
}

TEST_F(ZephWorkerTest, AnswersComeOnAnyThreadAndWhenEverythingIsGone) {
    startSession(AudioServiceTypeAlarms);
    sendLow();
    sendLeak(kSoundKey);
    session.reset();
    device.restart();
    device.bugCapture.answer(kOpened);
    device.bugCapture.answer(kOpened);
    EXPECT_EQ(device.log.count("Started Zeph session for"), 2U);
    startSession(AudioServiceTypeAlarms);
    sendLow();
    device.setThreshold(LogLevel::fault); // the log's lock would keep the threads apart
    std::thread answering([this] { device.bugCapture.answer(kOpened); });
    for (int i = 0; i < 20; ++i) {
        session->stop();
        session->start();
    }
    answering.join();
    session->stop();
    EXPECT_EQ(device.bugCapture.requests.back().session, "S-1");
}

TEST_F(ZephWorkerTest, RepliesSayWhetherThereIsACapture) {
    const std::string failed = "Failed starting zeph session. reason=";
    const struct {
        Dictionary response;
        std::string line;
        std::string identifier = "NONE_RETURNED";
    } cases[] = {
        {kOpened, "i Started Zeph session. sessionId=S-1", "S-1"},
        {{{"success", 1.0}, {"session_id", 17}}, "i Started Zeph session. sessionId=17", "17"},
        {{{"success", true}, {"reason", 3}}, "e Started Zeph session, but no sessionId found!"},
        {{}, "e Failed starting zeph session. Unknown reason."},
        {{{"success", 2}, {"session_id", "S"}}, "e Failed starting zeph session. Unknown reason."},
        {{{"success", "true"}, {"reason", "none"}}, "e " + failed + "kGlarnErrorNone"},
        {{{"success", false}, {"reason", 0x1'0000'0000}}, "e " + failed + "kGlarnErrorNone"},
        {{{"reason", 1.9}}, "i " + failed + "kGlarnErrorServiceNotReady"},
        {{{"reason", 9}}, "i " + failed + "kGlarnErrorRequestThrottled"},
        {{{"reason", 10}}, "i " + failed + "10"},
        {{{"reason", 0xFFFF'FFFF}}, "i " + failed + "-1"},
    };
    for (const auto& row : cases) {
        EXPECT_EQ(ZRReportingSessionZephWorker::getSessionIdentifierFromResponse(row.response),
                  row.identifier);
        EXPECT_THAT(logged(ZRReportingZephLogCategory()), ElementsAre(row.line));
    }
}

} // namespace
} // namespace tamblo
