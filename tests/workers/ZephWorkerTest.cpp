#include "base/Format.h"
#include "tests/workers/WorkerTest.h"
#include "workers/sinks/ZRReportingSessionZephWorker.h"
#include "workers/sinks/zeph/WorkerInstanceState.h"

#include <optional>
#include <thread>

namespace tamblo {
namespace {

using testing::ElementsAre;
using namespace std::chrono_literals;

constexpr const char* kHapticKey = "Haptic_Active_Hardware_Time_Seconds";
constexpr const char* kSoundKey = "System_Sound_Stuck_Time_Seconds";
const Dictionary kHaptic{{kHapticKey, 90}};
const Dictionary kSound{{kSoundKey, 90}};
const Dictionary kLow{{"issue_type", "LowRMS"}};
const Dictionary kOpened{{"success", true}, {"session_id", "S-1"}};

class ZephWorkerTest : public WorkerTest {
protected:
    ZephWorkerTest() : WorkerTest(LogLevel::debug, true) {
        device.deviceProperties.set("HapticLeakCapture", true);
    }

    void startSession(AudioServiceType type, bool isSingle = false) {
        session = makeSession(type);
        session->setIsSingleMessageSession(isSingle);
        session->start();
    }
    void sendNow(const Dictionary& payload, AudioEventCategory category, AudioEventType type) {
        device.clock.advance(1ms);
        send(payload, category, type);
    }
    /// A number is a time in seconds.
    void play(const std::string& script) {
        const Dictionary failure{{"reason", 1}};
        playWords(script,
                  {{"alarms", [this] { startSession(AudioServiceTypeAlarms); }},
                   {"alerts", [this] { startSession(AudioServiceTypeAlerts); }},
                   {"test", [this] { startSession(AudioServiceTypeTest); }},
                   {"low", [this] { sendNow(kLow, AudioEventKindError, AudioEventTypeIssueDetector); }},
                   {"haptic", [this] { sendNow(kHaptic, 4, AudioEventTypeJoulery); }},
                   {"sound", [this] { sendNow(kSound, 4, AudioEventTypeJoulery); }},
                   {"start", [this] { session->start(); }},
                   {"stop", [this] { session->stop(); }},
                   {"answered", [this] { device.bugCapture.answer(kOpened); }},
                   {"failing", [&] { device.bugCapture.promptAnswer = failure; }},
                   {"refused", [this] { device.bugCapture.accepts = false; }}},
                  [this](const auto& word) { device.clock.advance(std::chrono::seconds(std::stoi(word))); });
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

TEST(WorkerInstanceStateTest, IsDueAtTheCountOrElseAfterTheTime) {
    const struct {
        std::optional<std::uint64_t> count;
        std::optional<std::chrono::duration<double>> duration;
        std::uint64_t seen;
        std::chrono::nanoseconds since;
        bool isDue;
    } cases[] = {{3, {}, 2, 0s, false},    {3, {}, 3, 0s, true},         {1, 10s, 1, -1s, true},
                 {0, 10s, 9, 10s, false},  {0, 10s, 1, 10s + 1ns, true}, {0, 10s, 9, -99s, false},
                 {0, {}, 9, 9999h, false}, {{}, 1s, 9, 99s, false}};
    for (const auto& [count, duration, seen, since, isDue] : cases) {
        WorkerInstanceState state;
        state.interestThresholdCount = count.value_or(state.interestThresholdCount);
        state.interestThresholdDurationSeconds = duration.value_or(state.interestThresholdDurationSeconds);
        state.interestedCount = seen;
        state.interestFirstSeen = WallTime(1h);
        EXPECT_EQ(state.isDue(WallTime(1h + since)), isDue) << seen << " " << since.count();
    }
}

TEST_F(ZephWorkerTest, EachDetectorLooksAtItsOwnMessages) {
    const struct {
        AudioServiceType service;
        AudioEventType type;
        AudioEventCategory category;
        Dictionary payload;
        std::string interested;
        bool isSingle = false;
    } cases[] = {
        {4, 8, 4, {{kHapticKey, "x"}, {kSoundKey, false}}, "HapticLeaks SSSLeaks "},
        {2, 8, 0xFFFFFFFF, {{kHapticKey, 1}, {kSoundKey, 1}}, "HapticLeaks SSSLeaks ", true},
        {4, 7, 11, {{kHapticKey, 1}, {kSoundKey, 1}}, ""},
        {4, 7, 11, kLow, "AlarmLowRMS "},
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
        {"a test goes as far as to make a reporter", "test low low low sound stop", ""},
    };
    for (const auto& row : cases) {
        session.reset();
        device.restart();
        device.bugCapture.accepts = true;
        device.bugCapture.promptAnswer.reset();
        device.bugCapture.replies.clear();
        device.bugCapture.reportersMade = 0;
        play(row.script);
        EXPECT_EQ(asked(), row.asked) << row.what;
    }
    EXPECT_EQ(device.bugCapture.reportersMade, 2);
}

TEST_F(ZephWorkerTest, CapturesSayWhatTheyAreOf) {
    play("alarms haptic haptic low low low");
    std::string found;
    for (const auto& request : device.bugCapture.requests) {
        const BugCaptureSignature& filed = request.signature;
        found +=
            formatted("{}/{}/{}/{}/{} {} {}\n", filed.domain, filed.type, filed.subType, filed.subTypeContext,
                      filed.detectedProcess, request.duration.count(), jsonText(request.payload));
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
        const char* levels;
        const char* identifier = "NONE_RETURNED";
    } cases[] = {
        {{{"success", 1.0}, {"session_id", 17}}, "i", "17"},
        {{{"success", true}, {"reason", 3}}, "e"},
        {{{"success", 2}, {"session_id", "S"}}, "e"},
        {{{"reason", "none"}}, "e"},
        {{{"reason", 0x1'0000'0000}}, "e"},
        {{{"reason", 9}}, "i"},
        {{{"reason", 10}}, "i"},
        {{{"reason", 0xFFFF'FFFF}}, "i"},
    };
    for (const auto& [response, levels, identifier] : cases) {
        EXPECT_EQ(ZRReportingSessionZephWorker::getSessionIdentifierFromResponse(response), identifier);
        EXPECT_EQ(loggedLevels(ZRReportingZephLogCategory()), levels);
    }
}

} // namespace
} // namespace tamblo
