#include "base/Format.h"
#include "tests/workers/WorkerTest.h"
#include "workers/sinks/ZRReportingSessionZephWorker.h"

#include <optional>
#include <sstream>
#include <thread>

namespace tamblo {
namespace {

using testing::ElementsAre;
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
    void sendLeak(const char* key) {
        device.clock.advance(1ms);
        send({{key, 90}}, AudioEventKindPlayback, AudioEventTypeJoulery);
    }
    void sendLow() {
        device.clock.advance(1ms);
        send(kLow, AudioEventKindError, AudioEventTypeIssueDetector);
    }
    /// Does what the words say; a number is a time in seconds.
    void play(const std::string& script) {
        std::istringstream words(script);
        for (std::string word; words >> word;) {
            if (word == "alarms" || word == "alerts") {
                startSession(word == "alarms" ? AudioServiceTypeAlarms : AudioServiceTypeAlerts);
            } else if (word == "low") {
                sendLow();
            } else if (word == "haptic" || word == "sound") {
                sendLeak(word == "haptic" ? kHapticKey : kSoundKey);
            } else if (word == "start") {
                session->start();
            } else if (word == "stop") {
                session->stop();
            } else if (word == "answered") {
                device.bugCapture.answer(kOpened);
            } else if (word == "failing") {
                device.bugCapture.promptAnswer = Dictionary{{"reason", 1}};
            } else if (word == "refused") {
                device.bugCapture.accepts = false;
            } else {
                device.clock.advance(std::chrono::seconds(std::stoi(word)));
            }
        }
    }
    /// What was asked of the capture service since the last call.
    std::string asked() {
        std::string found;
        for (const auto& request : std::exchange(device.bugCapture.requests, {})) {
            EXPECT_THAT(request.processes, ElementsAre(kClient, kOtherClient));
            found += request.operation + " " +
                     (request.operation == "cancel" ? request.session : request.signature.type) + "; ";
        }
        return found;
    }
};

TEST_F(ZephWorkerTest, DetectorsFireAtTheirThresholdsAndBeginAnew) {
    const struct {
        std::optional<std::uint64_t> count; ///< without one, the state's own
        std::optional<std::chrono::duration<double>> duration;
        std::vector<std::pair<std::chrono::nanoseconds, int>> steps; ///< wait, number; 0: of no interest
        std::string calls;
        int fired;
        bool once = false, doesFire = true;
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

TEST_F(ZephWorkerTest, DetectorsAskForCaptures) {
    const struct {
        const char* what;
        const char* script;
        const char* asked;
    } cases[] = {
        {"two leaks of haptics, over sessions", "alerts haptic alarms haptic", "snapshot haptics; "},
        {"repeats count", "alerts haptic haptic haptic haptic", "snapshot haptics; snapshot haptics; "},
        {"each stuck sound", "alerts sound", "snapshot systemsounds; "},
        {"but none of 15 seconds", "alerts sound 14 alerts sound 0 sound", "snapshot systemsounds; "},
        {"from the last capture on", "alerts sound 15 sound 10 sound 5 sound",
         "snapshot systemsounds; snapshot systemsounds; snapshot systemsounds; "},
        {"two low alarms are too few", "alarms low low stop", ""},
        {"over a stop, and once; not answered, nothing is cancelled",
         "alarms low low stop start low low stop", "start alarms; "},
        {"every later stop cancels again", "alarms low low low answered stop start low low low stop",
         "start alarms; cancel S-1; cancel S-1; "},
        {"a capture that failed is cancelled, too", "alarms failing low low low stop",
         "start alarms; cancel NONE_RETURNED; "},
        {"one that was refused is not", "alarms refused low low low stop", "start alarms; "},
    };
    device.deviceProperties.set("HapticLeakCapture", true);
    for (const auto& row : cases) {
        session.reset();
        device.restart();
        device.bugCapture.accepts = true;
        device.bugCapture.promptAnswer.reset();
        device.bugCapture.replies.clear();
        play(row.script);
        EXPECT_EQ(asked(), row.asked) << row.what;
    }
}

TEST_F(ZephWorkerTest, CapturesSayWhatTheyAreOf) {
    device.deviceProperties.set("HapticLeakCapture", true);
    play("alarms haptic haptic low low low");
    std::string found;
    for (const auto& [operation, processes, filed, duration, payload, identifier] :
         device.bugCapture.requests) {
        found += formatted("{}/{}/{}/{}/{} {} {}\n", filed.domain, filed.type, filed.subType,
                           filed.subTypeContext, filed.detectedProcess, duration.count(), jsonText(payload));
    }
    EXPECT_EQ(found, "Tonmetry/haptics/Playback/Joulery/Unknown 0.000000 "
                     R"({"diagnostic_extension_parameters":)"
                     R"({"com.vandra.powerlog.systemlog.filterprocess":{"processIDs":[77,78]}}})"
                     "\nTonmetry/alarms/Error/IssueDetector/caller 60.000000 {}\n");
}

TEST_F(ZephWorkerTest, AnswersComeOnAnyThreadAndWhenEverythingIsGone) {
    play("alarms low low low sound");
    session.reset();
    device.restart();
    play("answered answered");
    EXPECT_EQ(device.log.count("Started Zeph session for"), 2U);
    play("alarms low low low");
    device.setThreshold(LogLevel::fault); // the log's lock would keep the threads apart
    std::thread answering([this] { device.bugCapture.answer(kOpened); });
    for (int i = 0; i < 20; ++i) {
        play("stop start");
    }
    answering.join();
    session->stop();
    EXPECT_EQ(device.bugCapture.requests.back().session, "S-1");
}

TEST_F(ZephWorkerTest, RepliesSayWhetherThereIsACapture) {
    const struct {
        Dictionary response;
        const char* line;
        const char* identifier = "NONE_RETURNED";
    } cases[] = {
        {{{"success", 1.0}, {"session_id", 17}}, "i Started Zeph session. sessionId=17", "17"},
        {{{"success", true}, {"reason", 3}}, "e Started Zeph session, but no sessionId found!"},
        {{{"success", 2}, {"session_id", "S"}}, "e Failed starting zeph session. Unknown reason."},
        {{{"reason", "none"}}, "e Failed starting zeph session. reason=kGlarnErrorNone"},
        {{{"reason", 0x1'0000'0000}}, "e Failed starting zeph session. reason=kGlarnErrorNone"},
        {{{"reason", 9}}, "i Failed starting zeph session. reason=kGlarnErrorRequestThrottled"},
        {{{"reason", 10}}, "i Failed starting zeph session. reason=10"},
        {{{"reason", 0xFFFF'FFFF}}, "i Failed starting zeph session. reason=-1"},
    };
    for (const auto& [response, line, identifier] : cases) {
        EXPECT_EQ(ZRReportingSessionZephWorker::getSessionIdentifierFromResponse(response), identifier);
        EXPECT_THAT(logged(ZRReportingZephLogCategory()), ElementsAre(line));
    }
}

} // namespace
} // namespace tamblo
