#include "base/Format.h"
#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"
#include "util/InternalBuild.h"
#include "util/LogCategories.h"
#include "workers/sinks/ZRReportingSessionZephWorker.h"
#include "workers/sinks/zeph/ZRReportingZephWorkerInstanceHapticLeaks.h"

#include <gmock/gmock.h>

#include <chrono>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

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

class ZephWorkerTest : public testing::Test {
protected:
    ~ZephWorkerTest() override { ZRReportingSessionZephWorker::reset(); }

    static std::shared_ptr<ZRReportingSession> startedSession(AudioServiceType type, bool isSingle = false) {
        auto session = ZRReportingSession::initWithID(5, {42, 43});
        session->setIsSingleMessageSession(isSingle);
        session->setServiceType(type);
        session->setClientProcessName("alarmd");
        session->start();
        return session;
    }
    void sendLeak(ZRReportingSession& session, const char* key, std::chrono::nanoseconds wait = 1ms) {
        device.clock.advance(wait);
        session.sendMessage(messageOf({{key, 90}}, AudioEventKindPlayback, AudioEventTypeJoulery));
    }
    void sendLow(ZRReportingSession& session, int times = 3) {
        for (int i = 0; i < times; ++i) {
            device.clock.advance(1ms);
            session.sendMessage(messageOf(kLow, AudioEventKindError, AudioEventTypeIssueDetector));
        }
    }
    /// Since the last call: what was asked of the capture service, and then `LEVEL TEXT` of the bug captures'
    /// lines above debug.
    std::vector<std::string> seen() {
        std::vector<std::string> found;
        for (const auto& [operation, processes, filed, duration, payload, session] :
             std::exchange(device.bugCapture.requests, {})) {
            EXPECT_THAT(processes, ElementsAre(42, 43));
            found.push_back(operation == "cancel"
                                ? "cancel " + session
                                : formatted("{} {}/{}/{}/{}/{} {} {}", operation, filed.domain, filed.type,
                                            filed.subType, filed.subTypeContext, filed.detectedProcess,
                                            duration.count(), jsonText(payload)));
        }
        for (const FakeLog::Line& line : device.log.lines()) {
            if (line.category == ZRReportingZephLogCategory().code() && line.level != LogLevel::debug) {
                found.push_back((line.level == LogLevel::error ? "error " : "info ") + line.text);
            }
        }
        device.log.clear();
        return found;
    }

    FakePlatform device{LogLevel::debug, true};
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
        .initWithSession = [](const auto& session) -> std::unique_ptr<ZRReportingSessionZephWorkerInstance> {
            auto detector = std::make_unique<ScriptedDetector>(session);
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
        const auto session = startedSession(row.serviceType);
        ZRReportingSessionZephWorker worker(session);
        worker.addInstance(scripted);
        EXPECT_EQ(worker.start(), true);
        for (const auto& [wait, number] : row.steps) {
            device.clock.advance(wait);
            worker.handleMessage(messageOf({{number != 0 ? "n" : "m", number}}, 4, AudioEventTypeState));
            worker.handleMessage(messageOf({{"n", -number}}, 4, AudioEventTypeHistogram));
        }
        worker.stop();
        EXPECT_EQ(ScriptedDetector::calls, "s" + row.calls + "e");
        EXPECT_EQ(device.bugCapture.reportersMade, row.fired) << row.calls;
    }
    const std::string skipped = "info Skipping actual fire, as we are running in test mode.";
    EXPECT_THAT(seen(), ElementsAre(skipped, skipped));
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
        const auto session = startedSession(row.service, row.isSingle);
        device.log.clear();
        device.clock.advance(1s);
        session->sendMessage(messageOf(row.payload, row.category, row.type));
        std::string interested;
        for (const std::string& line : device.log.texts(beginning)) {
            interested += line.substr(beginning.size(), line.find(',') - beginning.size()) + " ";
        }
        EXPECT_EQ(interested, row.interested) << row.type << jsonText(row.payload);
    }
    device.deviceProperties.set("InternalBuild", false);
    forgetInternalBuild();
    EXPECT_EQ(ZRReportingSessionZephWorker::initWithSession(startedSession(4)), nullptr);
}

TEST_F(ZephWorkerTest, LeaksOfHapticsAreCountedOverSessionsAndRepeats) {
    const std::string snapshot = "snapshot Tonmetry/haptics/Playback/Joulery/Unknown 0.000000 "
                                 R"({"diagnostic_extension_parameters":)"
                                 R"({"com.vandra.powerlog.systemlog.filterprocess":{"processIDs":[42,43]}}})";
    sendLeak(*startedSession(AudioServiceTypeAlerts), kHapticKey); // counted by nobody
    device.deviceProperties.set("HapticLeakCapture", true);
    device.bugCapture.promptAnswer = kOpened;
    sendLeak(*startedSession(AudioServiceTypeAlerts), kHapticKey);
    const auto session = startedSession(AudioServiceTypeTelephony);
    EXPECT_THAT(seen(), IsEmpty());
    sendLeak(*session, kHapticKey);
    EXPECT_THAT(seen(), ElementsAre(snapshot, "info Started Zeph session. sessionId=S-1",
                                    "info Started Zeph session for haptics leaks. sessionId=S-1 response=" +
                                        jsonText(kOpened),
                                    "info Parameters to Zeph session accepted."));
    EXPECT_EQ(sharedWorkerInstanceState(ZRReportingZephWorkerInstanceHapticLeaks::kClassName, nullptr)
                  ->currentZephSessionIdentifier(),
              "S-1");
    device.bugCapture.accepts = false;
    sendLeak(*session, kHapticKey);
    sendLeak(*session, kHapticKey);
    EXPECT_THAT(seen(), ElementsAre(snapshot, "error Parameters to Zeph session not accepted!"));
    EXPECT_EQ(session->acceptedMessageCount(), 1U); // the others repeated it
}

TEST_F(ZephWorkerTest, StuckSystemSoundsAreCapturedOnceInFifteenSeconds) {
    constexpr std::chrono::nanoseconds waits[] = {0s, 15s - 1ns, 1ns, 10s, 5s};
    std::string answers;
    for (const auto wait : waits) {
        sendLeak(*startedSession(AudioServiceTypeAlerts), kSoundKey, wait);
        const std::string first = seen().at(0);
        answers += first.substr(0, first.find('{'));
    }
    const std::string captured = "snapshot Tonmetry/systemsounds/Playback/Joulery/Unknown 0.000000 ";
    const std::string limited = "info Already fired ZRReportingZephWorkerInstanceSSSLeaks recently.";
    EXPECT_EQ(answers, captured + limited + captured + limited + captured);
    device.bugCapture.answer({{"reason", 6}});
    EXPECT_EQ(seen().back(), "info Started Zeph session for system sound server leaks. "
                             R"(sessionId=NONE_RETURNED response={"reason":6})");
}

TEST_F(ZephWorkerTest, StopCancelsTheCaptureOfALowAlarm) {
    const std::string start = "start Tonmetry/alarms/Error/IssueDetector/alarmd 60.000000 {}";
    auto session = startedSession(AudioServiceTypeAlarms);
    sendLow(*session, 2);
    session->stop();
    session->start();
    EXPECT_THAT(seen(), IsEmpty());
    sendLow(*session, 4); // once only
    session->stop();      // not answered yet: nothing to cancel
    device.bugCapture.answer(kOpened);
    EXPECT_THAT(seen(),
                ElementsAre(start,
                            "info Parameters to Zeph session for alarm Low RMS accepted. Will fire if "
                            "not cancelled. timeout=60.000000.",
                            "info Started Zeph session. sessionId=S-1",
                            "info Started Zeph session for alarm Low RMS. sessionId=S-1 "
                            "timeout=60.000000 response=" +
                                jsonText(kOpened)));
    for (int round = 0; round < 2; ++round) {
        session->start();
        sendLow(*session);
        session->stop();
        EXPECT_THAT(seen(),
                    ElementsAre("cancel S-1", "info Stop called. Cancelling Zeph session for alarm Low RMS. "
                                              "sessionId=S-1 timeout=60.000000"));
    }
    session = startedSession(AudioServiceTypeAlarms);
    device.bugCapture.promptAnswer = Dictionary{{"reason", 1}};
    sendLow(*session);
    session->stop();
    EXPECT_THAT(seen(), testing::IsSupersetOf({start, std::string("cancel NONE_RETURNED")}));
    session = startedSession(AudioServiceTypeAlarms);
    device.bugCapture.accepts = false;
    sendLow(*session);
    session->stop();
    EXPECT_THAT(seen(), ElementsAre(start, "error Zeph session for alarm Low RMS failed to start."));
}

TEST_F(ZephWorkerTest, AnswersComeOnAnyThreadAndWhenEverythingIsGone) {
    auto session = startedSession(AudioServiceTypeAlarms);
    sendLow(*session);
    sendLeak(*session, kSoundKey);
    session.reset();
    ZRReportingSessionZephWorker::reset();
    device.bugCapture.answer(kOpened);
    device.bugCapture.answer(kOpened);
    EXPECT_EQ(device.log.count("Started Zeph session for"), 2U);
    session = startedSession(AudioServiceTypeAlarms);
    sendLow(*session);
    device.log.setThreshold(LogLevel::fault); // the log's lock would keep the threads apart
    forgetLogThresholds();
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
        {kOpened, "info Started Zeph session. sessionId=S-1", "S-1"},
        {{{"success", 1.0}, {"session_id", 17}}, "info Started Zeph session. sessionId=17", "17"},
        {{{"success", true}, {"reason", 3}}, "error Started Zeph session, but no sessionId found!"},
        {{}, "error Failed starting zeph session. Unknown reason."},
        {{{"success", 2}, {"session_id", "S"}}, "error Failed starting zeph session. Unknown reason."},
        {{{"success", "true"}, {"reason", "none"}}, "error " + failed + "kGlarnErrorNone"},
        {{{"success", false}, {"reason", 0x1'0000'0000}}, "error " + failed + "kGlarnErrorNone"},
        {{{"reason", 1.9}}, "info " + failed + "kGlarnErrorServiceNotReady"},
        {{{"reason", 7}}, "info " + failed + "kGlarnErrorRandomizedSuppression"},
        {{{"reason", 9}}, "info " + failed + "kGlarnErrorRequestThrottled"},
        {{{"reason", 10}}, "info " + failed + "10"},
        {{{"reason", 0xFFFF'FFFF}}, "info " + failed + "-1"},
    };
    for (const auto& row : cases) {
        EXPECT_EQ(ZRReportingSessionZephWorker::getSessionIdentifierFromResponse(row.response),
                  row.identifier);
        EXPECT_THAT(seen(), ElementsAre(row.line));
    }
}

} // namespace
} // namespace tamblo
