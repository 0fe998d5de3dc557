#include "base/Format.h"
#include "base/Json.h"
#include "session/ZRReportingSession.h"
#include "tests/fakes/FakePlatform.h"
#include "util/InternalBuild.h"
#include "util/LogCategories.h"
#include "workers/sinks/ZRReportingSessionZephWorker.h"

#include <gmock/gmock.h>

#include <chrono>
#include <string>
#include <thread>
#include <utility>
#include <vector>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::ElementsAreArray;
using testing::IsEmpty;
using namespace std::chrono_literals;

constexpr const char* kHapticKey = "Haptic_Active_Hardware_Time_Seconds";
constexpr const char* kSoundKey = "System_Sound_Stuck_Time_Seconds";
const Dictionary kOpened{{"success", true}, {"session_id", "S-1"}};

MessageRef sentMessage(Dictionary payload, AudioEventType type, AudioEventCategory category = 4) {
    return std::make_shared<ZRReportingSessionMessage>(std::move(payload), category, type);
}

/// Interested in whatever has a number; keeps what happens to it.
class ScriptedDetector final : public ZRReportingSessionZephWorkerInstance {
public:
    explicit ScriptedDetector(std::weak_ptr<ZRReportingSession> session)
        : ZRReportingSessionZephWorkerInstance(std::move(session)) {
        setWorkerState(nextState);
    }
    [[nodiscard]] bool interestedInMessage(const ZRReportingSessionMessage& message) const override {
        return message.payload().contains("n");
    }
    void start() override { calls += 's'; }
    [[nodiscard]] bool canFire() const noexcept override { return doesFire; }
    void fire(const ZRReportingSessionMessage&) override { calls += 'F'; }
    void handleMessage(const ZRReportingSessionMessage&) override { calls += '.'; }
    void stop() override { calls += 'e'; }

    static inline std::shared_ptr<WorkerInstanceState> nextState;
    static inline bool doesFire = true;
    static inline std::string calls;
};

class ZephWorkerTest : public testing::Test {
protected:
    ~ZephWorkerTest() override { ZRReportingSessionZephWorker::reset(); }

    static std::shared_ptr<ZRReportingSession> startedSession(AudioServiceType serviceType,
                                                              bool isSingle = false) {
        auto session = ZRReportingSession::initWithID(5, {42, 43});
        session->setIsSingleMessageSession(isSingle);
        session->setServiceType(serviceType);
        session->setClientProcessName("alarmd");
        session->start();
        return session;
    }
    static void sendJoulery(ZRReportingSession& session, const char* key) {
        session.sendMessage(sentMessage({{key, 90}}, AudioEventTypeJoulery));
    }
    void sendLowRMS(ZRReportingSession& session, int times) {
        for (int i = 0; i < times; ++i) {
            device.clock.advance(1ms);
            session.sendMessage(
                sentMessage({{"issue_type", "LowRMS"}}, AudioEventTypeIssueDetector, AudioEventKindError));
        }
    }
    /// `LEVEL TEXT` of the bug captures' lines above debug since the last call.
    std::vector<std::string> lines() {
        std::vector<std::string> found;
        for (const FakeLog::Line& line : device.log.lines()) {
            if (line.category == ZRReportingZephLogCategory().code() && line.level != LogLevel::debug) {
                found.push_back((line.level == LogLevel::error ? "error " : "info ") + line.text);
            }
        }
        device.log.clear();
        return found;
    }
    /// What was asked for since the last call.
    std::vector<std::string> requests() {
        std::vector<std::string> found;
        for (const auto& request : std::exchange(device.bugCapture.requests, {})) {
            const BugCaptureSignature& filed = request.signature;
            EXPECT_THAT(request.processes, ElementsAre(42, 43));
            found.push_back(request.operation == "cancel"
                                ? "cancel " + request.session
                                : formatted("{} {}/{}/{}/{}/{} {} {}", request.operation, filed.domain,
                                            filed.type, filed.subType, filed.subTypeContext,
                                            filed.detectedProcess, request.duration.count(),
                                            jsonText(request.payload)));
        }
        return found;
    }

    FakePlatform device{LogLevel::debug, true};
};

TEST_F(ZephWorkerTest, DetectorsFireAtTheirThresholdsAndBeginAnew) {
    struct Step {
        std::chrono::nanoseconds wait;
        int number; ///< 0: of no interest
    };
    constexpr std::chrono::duration<double> never{std::numeric_limits<double>::max()};
    const struct {
        std::uint64_t count;
        std::chrono::duration<double> duration;
        std::vector<Step> steps;
        std::string calls;
        std::uint64_t fired;
        bool once = false;
        bool doesFire = true;
        AudioServiceType serviceType = AudioServiceTypeAlarms;
    } cases[] = {
        {3, never, {{0s, 1}, {0s, 2}, {0s, 3}, {0s, 4}, {0s, 5}, {0s, 6}, {0s, 7}}, "...F...F.", 2},
        {2, never, {{0s, 1}, {9s, 1}, {0s, 0}, {0s, 2}, {0s, 2}, {0s, 1}}, "..F..F", 2}, // repeats
        {2, never, {{0s, 1}, {0s, 2}, {0s, 1}, {0s, 1}}, "..F.", 1},
        {0, 10s, {{0s, 1}, {10s, 2}, {1ns, 3}, {9s, 4}, {11s, 5}}, "...F..F", 2},
        {0, 10s, {{0s, 1}, {-99s, 2}, {109s, 3}, {1ns, 4}}, "....F", 1}, // the clock steps back
        {2, 60s, {{0s, 1}, {0s, 2}}, "..F", 1},
        {1, 1s, {{0s, 1}, {0s, 2}, {0s, 2}, {0s, 3}}, ".F..", 1, true},
        {UINT64_MAX, 1s, {{0s, 1}, {99s, 2}}, "..", 0},
        {1, never, {{0s, 1}, {0s, 2}}, "..", 0, false, false},
        {1, never, {{0s, 1}, {0s, 2}}, "..", 2, false, true, AudioServiceTypeTest},
    };
    constexpr ZephWorkerInstanceClass scripted{
        .name = "Scripted",
        .messageType = AudioEventTypeState,
        .initWithSession = [](const std::shared_ptr<ZRReportingSession>& session)
            -> std::unique_ptr<ZRReportingSessionZephWorkerInstance> {
            return std::make_unique<ScriptedDetector>(session);
        }};
    for (const auto& row : cases) {
        const auto session = startedSession(row.serviceType);
        const auto state = std::make_shared<WorkerInstanceState>();
        state->interestThresholdCount = row.count;
        state->interestThresholdDurationSeconds = row.duration;
        state->oncePerSession = row.once;
        ScriptedDetector::nextState = state;
        ScriptedDetector::doesFire = row.doesFire;
        ScriptedDetector::calls.clear();
        device.log.clear();
        ZRReportingSessionZephWorker worker(session);
        worker.addInstance(scripted);
        EXPECT_EQ(worker.start(), true);
        for (const Step& step : row.steps) {
            device.clock.advance(step.wait);
            worker.handleMessage(
                sentMessage({{step.number != 0 ? "n" : "m", step.number}}, AudioEventTypeState));
            worker.handleMessage(sentMessage({{"n", -step.number}}, AudioEventTypeHistogram));
        }
        worker.stop();
        EXPECT_EQ(ScriptedDetector::calls, "s" + row.calls + "e");
        EXPECT_EQ(state->firedCount, row.fired) << row.calls;
        EXPECT_EQ(state->symptomReporter != nullptr, row.fired > 0) << row.calls;
        EXPECT_EQ(device.log.count("Skipping actual fire, as we are running in test mode."),
                  row.serviceType == AudioServiceTypeTest ? row.fired : 0);
    }
    ScriptedDetector::nextState.reset();
}

TEST_F(ZephWorkerTest, EachDetectorLooksAtItsOwnMessages) {
    device.deviceProperties.set("HapticLeakCapture", true);
    const Dictionary low{{"issue_type", "LowRMS"}};
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
        {4, 7, 4, {{kHapticKey, 1}, {kSoundKey, 1}}, ""},
        {4, 8, 4, {{"EngineOnTime", 1}, {"issue_type", "LowRMS"}}, ""},
        {4, 7, 11, low, "AlarmLowRMS "},
        {11, 7, 11, low, "AlarmLowRMS "},
        {4, 7, 11, low, "", true},
        {2, 7, 11, low, ""},
        {4, 7, 0x0800000B, low, ""},
        {4, 6, 11, low, ""},
        {4, 7, 11, {{"issue_type", "lowRMS"}}, ""},
        {4, 7, 11, {{"issue", "LowRMS"}}, ""},
    };
    const std::string beginning = "Interested in message. instance=ZRReportingZephWorkerInstance";
    for (const auto& row : cases) {
        const auto session = startedSession(row.service, row.isSingle);
        device.log.clear();
        device.clock.advance(1s);
        session->sendMessage(sentMessage(row.payload, row.type, row.category));
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
    const std::string snapshot = R"(snapshot Tonmetry/haptics/Playback/Joulery/Unknown 0.000000 )"
                                 R"({"diagnostic_extension_parameters":)"
                                 R"({"com.vandra.powerlog.systemlog.filterprocess":)"
                                 R"({"processIDs":[42,43]}}})";
    const auto sendLater = [this](ZRReportingSession& session) {
        device.clock.advance(1ms);
        sendJoulery(session, kHapticKey);
    };
    sendLater(*startedSession(AudioServiceTypeAlerts)); // counted by nobody
    device.deviceProperties.set("HapticLeakCapture", true);
    device.bugCapture.promptAnswer = kOpened;
    sendLater(*startedSession(AudioServiceTypeAlerts));
    const auto session = startedSession(AudioServiceTypeTelephony);
    EXPECT_THAT(requests(), IsEmpty());
    sendLater(*session);
    EXPECT_THAT(requests(), ElementsAre(snapshot));
    EXPECT_THAT(lines(), ElementsAre("info Started Zeph session. sessionId=S-1",
                                     "info Started Zeph session for haptics leaks. sessionId=S-1 response=" +
                                         jsonText(kOpened),
                                     "info Parameters to Zeph session accepted."));
    device.bugCapture.accepts = false;
    sendLater(*session);
    sendLater(*session);
    EXPECT_THAT(requests(), ElementsAre(snapshot));
    EXPECT_THAT(lines(), ElementsAre("error Parameters to Zeph session not accepted!"));
    EXPECT_EQ(session->acceptedMessageCount(), 1U); // the others repeated it
}

TEST_F(ZephWorkerTest, StuckSystemSoundsAreCapturedOnceInFifteenSeconds) {
    const std::string limited = "info Already fired ZRReportingZephWorkerInstanceSSSLeaks recently.";
    const std::string accepted = "info Parameters to Zeph session accepted.";
    const struct {
        std::chrono::nanoseconds wait;
        std::string line;
    } steps[] = {{0s, accepted}, {15s - 1ns, limited}, {1ns, accepted}, {10s, limited}, {5s, accepted}};
    for (const auto& step : steps) {
        device.clock.advance(step.wait);
        const auto session = startedSession(AudioServiceTypeAlerts);
        (void)lines();
        sendJoulery(*session, kSoundKey);
        EXPECT_THAT(lines(), ElementsAre(step.line)) << step.wait.count();
    }
    EXPECT_EQ(device.bugCapture.requests.size(), 3U);
    EXPECT_THAT(requests()[0], testing::StartsWith("snapshot Tonmetry/systemsounds/"));
    device.bugCapture.answer({{"reason", 6}});
    EXPECT_EQ(lines().back(), "info Started Zeph session for system sound server leaks. "
                              R"(sessionId=NONE_RETURNED response={"reason":6})");
}

TEST_F(ZephWorkerTest, StopCancelsTheCaptureOfALowAlarm) {
    const auto session = startedSession(AudioServiceTypeAlarms);
    sendLowRMS(*session, 2);
    session->stop();
    session->start();
    (void)lines();
    EXPECT_THAT(requests(), IsEmpty());
    sendLowRMS(*session, 4); // once only
    session->stop();         // not answered yet: nothing to cancel
    EXPECT_THAT(requests(), ElementsAre("start Tonmetry/alarms/Error/IssueDetector/alarmd 60.000000 {}"));
    device.bugCapture.answer(kOpened);
    EXPECT_THAT(lines(),
                ElementsAre("info Parameters to Zeph session for alarm Low RMS accepted. Will fire if "
                            "not cancelled. timeout=60.000000.",
                            "info Started Zeph session. sessionId=S-1",
                            "info Started Zeph session for alarm Low RMS. sessionId=S-1 "
                            "timeout=60.000000 response=" +
                                jsonText(kOpened)));
    for (int round = 0; round < 2; ++round) {
        session->start();
        sendLowRMS(*session, 3);
        session->stop();
        EXPECT_THAT(requests(), ElementsAre("cancel S-1")) << round;
        EXPECT_THAT(lines(), ElementsAre("info Stop called. Cancelling Zeph session for alarm Low RMS. "
                                         "sessionId=S-1 timeout=60.000000"));
    }
    const auto unanswered = startedSession(AudioServiceTypeAlarms);
    device.bugCapture.promptAnswer = Dictionary{{"reason", 1}};
    sendLowRMS(*unanswered, 3);
    unanswered->stop();
    EXPECT_EQ(requests().back(), "cancel NONE_RETURNED");
    const auto refused = startedSession(AudioServiceTypeAlarms);
    device.bugCapture.accepts = false;
    (void)lines();
    sendLowRMS(*refused, 3);
    refused->stop();
    EXPECT_THAT(lines(), ElementsAre("error Zeph session for alarm Low RMS failed to start."));
}

TEST_F(ZephWorkerTest, AnswersComeOnAnyThreadAndWhenEverythingIsGone) {
    auto session = startedSession(AudioServiceTypeAlarms);
    sendLowRMS(*session, 3);
    device.log.setThreshold(LogLevel::fault); // the log's lock would keep the threads apart
    forgetLogThresholds();
    std::thread answering([this] { device.bugCapture.answer(kOpened); });
    for (int i = 0; i < 20; ++i) {
        session->stop();
        session->start();
    }
    answering.join();
    session->stop();
    EXPECT_EQ(requests().back(), "cancel S-1");
    session = startedSession(AudioServiceTypeAlarms);
    sendLowRMS(*session, 3);
    sendJoulery(*session, kSoundKey);
    session.reset();
    ZRReportingSessionZephWorker::reset();
    device.log.setThreshold(LogLevel::info);
    forgetLogThresholds();
    device.bugCapture.answer(kOpened);
    device.bugCapture.answer(kOpened);
    EXPECT_EQ(device.log.count("Started Zeph session for"), 2U);
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
        EXPECT_THAT(lines(), ElementsAre(row.line));
    }
}

} // namespace
} // namespace tamblo
