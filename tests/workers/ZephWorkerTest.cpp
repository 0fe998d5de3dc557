#include "base/Json.h"
#include "session/ZRReportingSession.h"
#include "tests/base/AllocationCount.h"
#include "tests/fakes/FakePlatform.h"
#include "util/InternalBuild.h"
#include "util/LogCategories.h"
#include "workers/sinks/ZRReportingSessionZephWorker.h"

#include <gmock/gmock.h>

#include <chrono>
#include <string>
#include <thread>
#include <vector>

namespace tamblo {
namespace {

using std::chrono::nanoseconds;
using testing::ElementsAre;
using testing::ElementsAreArray;
using testing::IsEmpty;
using namespace std::chrono_literals;

constexpr const char* kHapticKey = "Haptic_Active_Hardware_Time_Seconds";
constexpr const char* kSoundKey = "System_Sound_Stuck_Time_Seconds";
const Dictionary kOpened{{"success", true}, {"session_id", "S-1"}};

MessageRef messageOf(Dictionary payload, AudioEventType type, AudioEventCategory category = 4) {
    return std::make_shared<ZRReportingSessionMessage>(std::move(payload), category, type);
}

/// Interested in everything that has a number; keeps what happens to it.
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
        session.sendMessage(messageOf({{key, 90}}, AudioEventTypeJoulery));
    }
    void sendLowRMS(ZRReportingSession& session, int times) {
        for (int i = 0; i < times; ++i) {
            device.clock.advance(1ms);
            session.sendMessage(
                messageOf({{"issue_type", "LowRMS"}}, AudioEventTypeIssueDetector, AudioEventKindError));
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
    std::vector<std::string> operations() const {
        std::vector<std::string> found;
        for (const FakeBugCaptureService::Request& request : device.bugCapture.requests) {
            found.push_back(request.operation + request.session);
        }
        return found;
    }

    FakePlatform device{LogLevel::debug, true};
};

TEST_F(ZephWorkerTest, DetectorsFireAtTheirThresholdsAndBeginAnew) {
    struct Step {
        nanoseconds wait;
        int number; ///< 0: of no interest
    };
    struct Thresholds {
        std::optional<std::uint64_t> count;
        std::chrono::duration<double> duration{std::numeric_limits<double>::max()};
        bool once = false;
    };
    const struct {
        Thresholds thresholds;
        std::vector<Step> steps;
        std::string calls;
        std::uint64_t fired;
        std::uint64_t interested; ///< left over
        bool doesFire = true;
        AudioServiceType serviceType = AudioServiceTypeAlarms;
    } cases[] = {
        {{3}, {{0s, 1}, {0s, 2}, {0s, 3}, {0s, 4}, {0s, 5}, {0s, 6}, {0s, 7}}, "...F...F.", 2, 1},
        {{2}, {{0s, 1}, {9s, 1}, {0s, 0}, {0s, 2}, {0s, 2}, {0s, 1}}, "..F..F", 2, 0}, // repeats
        {{2}, {{0s, 1}, {0s, 2}, {0s, 1}, {0s, 1}}, "..F.", 1, 1},
        {{0, 10s}, {{0s, 1}, {10s, 2}, {1ns, 3}, {9s, 4}, {11s, 5}}, "...F..F", 2, 0},
        {{0, 10s}, {{0s, 1}, {-99s, 2}, {109s, 3}, {1ns, 4}}, "....F", 1, 0}, // the clock steps back
        {{1}, {{0s, 1}, {0s, 2}}, ".F.F", 2, 0},
        {{2, 60s}, {{0s, 1}, {0s, 2}}, "..F", 1, 0},
        {{1, 1s, true}, {{0s, 1}, {0s, 2}, {0s, 2}, {0s, 3}}, ".F..", 1, 2},
        {{}, {{0s, 1}, {99s, 2}}, "..", 0, 2},
        {{1}, {{0s, 1}, {0s, 2}}, "..", 0, 2, false},
        {{1}, {{0s, 1}, {0s, 2}}, "..", 2, 0, true, AudioServiceTypeTest},
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
        ScriptedDetector::nextState = std::make_shared<WorkerInstanceState>();
        WorkerInstanceState& state = *ScriptedDetector::nextState;
        if (row.thresholds.count) {
            state.interestThresholdCount = *row.thresholds.count;
        }
        state.interestThresholdDurationSeconds = row.thresholds.duration;
        state.oncePerSession = row.thresholds.once;
        ScriptedDetector::doesFire = row.doesFire;
        ScriptedDetector::calls.clear();
        device.bugCapture.reportersMade = 0;
        (void)lines();
        ZRReportingSessionZephWorker worker(session);
        worker.addInstance(scripted);
        EXPECT_EQ(worker.start(), true);
        for (const Step& step : row.steps) {
            device.clock.advance(step.wait);
            worker.handleMessage(
                messageOf({{step.number != 0 ? "n" : "m", step.number}}, AudioEventTypeState));
            worker.handleMessage(messageOf({{"n", -step.number}}, AudioEventTypeHistogram));
        }
        worker.stop();
        EXPECT_EQ(ScriptedDetector::calls, "s" + row.calls + "e");
        EXPECT_EQ(state.firedCount, row.fired) << row.calls;
        EXPECT_EQ(state.interestedCount, row.interested) << row.calls;
        EXPECT_EQ(state.lastMessage.has_value(), row.interested != 0) << row.calls;
        EXPECT_EQ(std::uint64_t(device.bugCapture.reportersMade), row.fired) << row.calls;
        const bool isTest = row.serviceType == AudioServiceTypeTest;
        EXPECT_THAT(lines(), ElementsAreArray(std::vector<std::string>(
                                 isTest ? row.fired : 0,
                                 "info Skipping actual fire, as we are running in test mode.")));
    }
    ScriptedDetector::nextState.reset();
}

TEST_F(ZephWorkerTest, EachDetectorLooksAtItsOwnMessages) {
    device.deviceProperties.set("HapticLeakCapture", true);
    const std::string haptic = "ZRReportingZephWorkerInstanceHapticLeaks";
    const std::string alarm = "ZRReportingZephWorkerInstanceAlarmLowRMS";
    const std::string sound = "ZRReportingZephWorkerInstanceSSSLeaks";
    const Dictionary low{{"issue_type", "LowRMS"}};
    const struct {
        AudioServiceType service;
        AudioEventType type;
        AudioEventCategory category;
        Dictionary payload;
        std::vector<std::string> interested;
        bool isSingle = false;
    } cases[] = {
        {4, 8, 4, {{kHapticKey, "x"}, {kSoundKey, false}}, {haptic, sound}},
        {4, 8, 4, {{kHapticKey, 1}, {kSoundKey, 1}}, {haptic, sound}, true},
        {2, 8, 0xFFFFFFFF, {{kSoundKey, 1}}, {sound}},
        {4, 7, 4, {{kHapticKey, 1}, {kSoundKey, 1}}, {}},
        {4, 8, 4, {{"EngineOnTime", 1}, {"issue_type", "LowRMS"}}, {}},
        {4, 7, 11, low, {alarm}},
        {11, 7, 11, low, {alarm}},
        {4, 7, 11, low, {}, true},
        {2, 7, 11, low, {}},
        {4, 7, 0x0800000B, low, {}},
        {4, 7, 12, low, {}},
        {4, 6, 11, low, {}},
        {4, 7, 11, {{"issue_type", "lowRMS"}}, {}},
        {4, 7, 11, {{"issue_type", Array{"LowRMS"}}}, {}},
        {4, 7, 11, {{"issue", "LowRMS"}}, {}},
    };
    for (const auto& row : cases) {
        const auto session = startedSession(row.service, row.isSingle);
        device.log.clear();
        device.clock.advance(1s);
        session->sendMessage(messageOf(row.payload, row.type, row.category));
        std::vector<std::string> interested;
        for (const std::string& line : device.log.texts("Interested in message. instance=")) {
            interested.push_back(line.substr(32, line.find(',') - 32));
        }
        EXPECT_THAT(interested, ElementsAreArray(row.interested)) << row.type << jsonText(row.payload);
    }
}

TEST_F(ZephWorkerTest, LeaksOfHapticsAreCountedOverSessionsAndRepeats) {
    sendJoulery(*startedSession(AudioServiceTypeAlerts), kHapticKey);
    device.deviceProperties.set("HapticLeakCapture", true);
    device.bugCapture.promptAnswer = kOpened;
    const auto first = startedSession(AudioServiceTypeAlerts);
    sendJoulery(*first, kHapticKey);
    first->stop();
    EXPECT_THAT(operations(), IsEmpty()); // without the property there was nobody to count the other
    const auto second = startedSession(AudioServiceTypeTelephony);
    (void)lines();
    device.clock.advance(1s);
    sendJoulery(*second, kHapticKey);
    ASSERT_THAT(operations(), ElementsAre("snapshot"));
    const FakeBugCaptureService::Request& request = device.bugCapture.requests[0];
    EXPECT_THAT(request.processes, ElementsAre(42, 43));
    const BugCaptureSignature& signature = request.signature;
    EXPECT_THAT((std::vector{signature.domain, signature.type, signature.subType, signature.subTypeContext,
                             signature.detectedProcess}),
                ElementsAre("Tonmetry", "haptics", "Playback", "Joulery", "Unknown"));
    EXPECT_EQ(request.duration, 0s);
    EXPECT_EQ(jsonText(request.payload), R"({"diagnostic_extension_parameters":)"
                                         R"({"com.vandra.powerlog.systemlog.filterprocess":)"
                                         R"({"processIDs":[42,43]}}})");
    EXPECT_THAT(lines(), ElementsAre("info Started Zeph session. sessionId=S-1",
                                     "info Started Zeph session for haptics leaks. sessionId=S-1 "
                                     R"(response={"session_id":"S-1","success":true})",
                                     "info Parameters to Zeph session accepted."));
    device.bugCapture.accepts = false;
    for (int i = 0; i < 2; ++i) { // both repeat the last message but for its time
        device.clock.advance(1s);
        sendJoulery(*second, kHapticKey);
    }
    EXPECT_EQ(second->totalMessageCount() - 2, std::int64_t(second->acceptedMessageCount()));
    EXPECT_THAT(operations(), ElementsAre("snapshot", "snapshot"));
    EXPECT_THAT(lines(), ElementsAre("error Parameters to Zeph session not accepted!"));
}

TEST_F(ZephWorkerTest, StuckSystemSoundsAreCapturedOnceInFifteenSeconds) {
    const std::string limited = "info Already fired ZRReportingZephWorkerInstanceSSSLeaks recently.";
    const std::string accepted = "info Parameters to Zeph session accepted.";
    const struct {
        nanoseconds wait;
        std::string line;
    } steps[] = {{0s, accepted}, {15s - 1ns, limited}, {1ns, accepted}, {10s, limited}, {5s, accepted}};
    for (const auto& step : steps) {
        device.clock.advance(step.wait);
        const auto session = startedSession(AudioServiceTypeAlerts);
        (void)lines();
        sendJoulery(*session, kSoundKey);
        EXPECT_THAT(lines(), ElementsAre(step.line)) << step.wait.count();
    }
    EXPECT_THAT(operations(), ElementsAre("snapshot", "snapshot", "snapshot"));
    EXPECT_EQ(device.bugCapture.requests[0].signature.type, "systemsounds");
    device.bugCapture.answer({{"reason", 6}});
    EXPECT_THAT(lines(),
                ElementsAre("info Failed starting zeph session. reason=kGlarnErrorDailyLimitExceeded",
                            "info Started Zeph session for system sound server leaks. "
                            R"(sessionId=NONE_RETURNED response={"reason":6})"));
}

TEST_F(ZephWorkerTest, StopCancelsTheCaptureOfALowAlarm) {
    const std::string cancelled =
        "info Stop called. Cancelling Zeph session for alarm Low RMS. sessionId=S-1 timeout=60.000000";
    const auto session = startedSession(AudioServiceTypeAlarms);
    sendLowRMS(*session, 2);
    session->stop();
    session->start();
    (void)lines();
    EXPECT_THAT(operations(), IsEmpty());
    sendLowRMS(*session, 4); // once only
    session->stop();         // not answered yet: nothing to cancel
    ASSERT_THAT(operations(), ElementsAre("start"));
    const FakeBugCaptureService::Request& request = device.bugCapture.requests[0];
    const BugCaptureSignature& signature = request.signature;
    EXPECT_THAT(
        (std::vector{signature.type, signature.subType, signature.subTypeContext, signature.detectedProcess}),
        ElementsAre("alarms", "Error", "IssueDetector", "alarmd"));
    EXPECT_EQ(request.duration, 60s);
    EXPECT_THAT(request.payload, Dictionary());
    device.bugCapture.answer(kOpened);
    EXPECT_THAT(lines(),
                ElementsAre("info Parameters to Zeph session for alarm Low RMS accepted. Will fire if "
                            "not cancelled. timeout=60.000000.",
                            "info Started Zeph session. sessionId=S-1",
                            "info Started Zeph session for alarm Low RMS. sessionId=S-1 "
                            R"(timeout=60.000000 response={"session_id":"S-1","success":true})"));
    for (int round = 0; round < 2; ++round) {
        session->start();
        sendLowRMS(*session, 3);
        session->stop();
        EXPECT_THAT(lines(), ElementsAre(cancelled)) << round;
    }
    EXPECT_THAT(operations(), ElementsAre("start", "cancelS-1", "cancelS-1"));

    const auto other = startedSession(AudioServiceTypeAlarms);
    device.bugCapture.promptAnswer = Dictionary{{"reason", 1}};
    sendLowRMS(*other, 3);
    other->stop();
    EXPECT_EQ(operations().back(), "cancelNONE_RETURNED");
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
    std::thread answering([this] { device.bugCapture.answer(kOpened); });
    for (int i = 0; i < 20; ++i) {
        session->stop();
        session->start();
    }
    answering.join();
    session->stop();
    EXPECT_EQ(operations().back(), "cancelS-1");
    session = startedSession(AudioServiceTypeAlarms);
    sendLowRMS(*session, 3);
    sendJoulery(*session, kSoundKey);
    session.reset();
    ZRReportingSessionZephWorker::reset();
    device.log.clear();
    device.bugCapture.answer(kOpened);
    device.bugCapture.answer(kOpened);
    EXPECT_EQ(device.log.count("Started Zeph session for"), 2U);
}

TEST_F(ZephWorkerTest, RepliesSayWhetherThereIsACapture) {
    const std::string failed = "Failed starting zeph session. reason=";
    const struct {
        Dictionary response;
        std::string identifier;
        std::string line;
    } cases[] = {
        {kOpened, "S-1", "info Started Zeph session. sessionId=S-1"},
        {{{"success", 1.0}, {"session_id", 17}}, "17", "info Started Zeph session. sessionId=17"},
        {{{"success", true}, {"reason", 3}}, "", "error Started Zeph session, but no sessionId found!"},
        {{}, "", "error Failed starting zeph session. Unknown reason."},
        {{{"success", 2}, {"session_id", "S"}}, "", "error Failed starting zeph session. Unknown reason."},
        {{{"success", "true"}, {"reason", 0}}, "", "error " + failed + "kGlarnErrorNone"},
        {{{"success", false}, {"reason", "none"}}, "", "error " + failed + "kGlarnErrorNone"},
        {{{"reason", 1}}, "", "info " + failed + "kGlarnErrorServiceNotReady"},
        {{{"reason", 2.9}}, "", "info " + failed + "kGlarnErrorNotSupported"},
        {{{"reason", 3}}, "", "info " + failed + "kGlarnErrorServiceUnavailable"},
        {{{"reason", 4}}, "", "info " + failed + "kGlarnErrorServiceInterrupted"},
        {{{"reason", 5}}, "", "info " + failed + "kGlarnErrorInvalidParameters"},
        {{{"reason", 7}}, "", "info " + failed + "kGlarnErrorRandomizedSuppression"},
        {{{"reason", 8}}, "", "info " + failed + "kGlarnErrorSessionNotFound"},
        {{{"reason", 0x1'0000'0009}}, "", "info " + failed + "kGlarnErrorRequestThrottled"},
        {{{"reason", 10}}, "", "info " + failed + "10"},
        {{{"reason", 0xFFFF'FFFF}}, "", "info " + failed + "-1"},
    };
    for (const auto& row : cases) {
        EXPECT_EQ(ZRReportingSessionZephWorker::getSessionIdentifierFromResponse(row.response),
                  row.identifier.empty() ? "NONE_RETURNED" : row.identifier);
        EXPECT_THAT(lines(), ElementsAre(row.line));
    }
}

TEST_F(ZephWorkerTest, OtherMessagesCostNothingAndOtherBuildsHaveNoWorker) {
    const auto session = startedSession(AudioServiceTypeAlarms);
    const auto worker = std::dynamic_pointer_cast<ZRReportingSessionWorkerConsumerProtocol>(
        ZRReportingSessionZephWorker::initWithSession(session));
    ASSERT_NE(worker, nullptr);
    worker->handleMessage(nullptr);
    for (const AudioEventType type : std::initializer_list<AudioEventType>{0, 6, 9, 7 + 256, 8 + 256}) {
        const MessageRef message = messageOf({{kSoundKey, 1}, {"issue_type", "LowRMS"}}, type, 11);
        EXPECT_EQ(test::allocationsOf([&] { worker->handleMessage(message); }).blocks, 0U) << type;
    }
    EXPECT_EQ(device.bugCapture.reportersMade, 0);
    device.deviceProperties.set("InternalBuild", false);
    forgetInternalBuild();
    EXPECT_EQ(ZRReportingSessionZephWorker::initWithSession(session), nullptr);
}

} // namespace
} // namespace tamblo
