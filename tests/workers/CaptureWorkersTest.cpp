#include "tests/workers/WorkerTest.h"
#include "workers/sinks/ZRReportingSessionDPWorker.h"
#include "workers/sinks/ZRReportingSessionQuilletWorker.h"

#include <cmath>

// The workers that draft bug reports and capture stacks.

namespace tamblo {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAreArray;

constexpr const char* kLastRun = "TalvixInvalidXyQLTlastRun";
constexpr const char* kSize = "smallest_buffer_frame_size";
constexpr const char* kCycle = "io_cycle";

class CaptureTest : public WorkerTest {
protected:
    using Worker = ZRReportingSessionDPWorker;
    CaptureTest() : WorkerTest(LogLevel::debug, true) {
        prefer("TalvixInvalidXyBackOffSeconds", "60.5 s");
        prefer("enable_stackburst", "YES");
    }
    void prefer(const std::string& key, Value value) {
        device.preferences.set(key, "com.vandra.tamblo.zrreporting", std::move(value));
    }
    /// How many drafts a message now makes, by its time after the first one's.
    std::size_t draftsOf(double offset, const std::string& key = "tvac_invalid_x") {
        const std::size_t before = device.bugReportDrafting.requests.size();
        quillet->handleMessage(messageOf({{key, 1}, {"zrreporting_timestamp", 1e9 + offset}}));
        return device.bugReportDrafting.requests.size() - before;
    }
    void arm() {
        quillet = tryToMake<ZRReportingSessionQuilletWorker>();
        EXPECT_EQ(draftsOf(0.0), 0U);
    }
    bool isTimeKept() {
        return device.preferences.copyPreferenceValue(kLastRun, "com.vandra.tamblo.zrreporting") ==
               Value(device.clock.seconds());
    }

    /// Whether an overload with these is captured.
    bool isCaptured(Worker& worker, const Dictionary& payload, AudioEventType type = 6,
                    AudioEventCategory category = 7) {
        const std::size_t before = device.diagnosticCapture.requests.size();
        worker.handleMessage(messageOf(payload, category, type));
        return device.diagnosticCapture.requests.size() != before;
    }

    const Dictionary overload{{kSize, 512}, {kCycle, 3}};
    std::shared_ptr<ZRReportingSessionQuilletWorker> quillet;
};

TEST_F(CaptureTest, DraftsFiveSecondsAfterTheFirstMessageOnceInARunAndInABackOffPeriod) {
    arm();
    EXPECT_EQ(draftsOf(5.0), 0U);
    EXPECT_EQ(draftsOf(5.1, "Tvac_invalid_x"), 0U);
    EXPECT_FALSE(isTimeKept());
    EXPECT_EQ(draftsOf(5.1), 1U);
    EXPECT_TRUE(isTimeKept());
    EXPECT_EQ(draftsOf(7.0), 0U);
    EXPECT_EQ(device.bugReportDrafting.requests.front().processName, "caller");
    (void)loggedLevels(ZRReportingSessionCategory());
    device.bugReportDrafting.requests.front().completion("no disk");
    EXPECT_EQ(loggedLevels(ZRReportingSessionCategory()), "e");
    quillet->stop();
    device.clock.advance(60'499ms);
    EXPECT_EQ(draftsOf(70.0), 0U);
    device.clock.advance(1ms);
    EXPECT_EQ(draftsOf(70.0), 1U);
}

TEST_F(CaptureTest, DraftsEvenWhenTheLastTimeIsRubbishOrTheSessionIsGone) {
    prefer("TalvixInvalidXyBackOffSeconds", 0);
    prefer(kLastRun, Array{1});
    arm();
    session.reset();
    (void)loggedLevels(ZRReportingSessionCategory());
    // Without a period, a run still has one draft; each message of interest moves the time on.
    for (const std::size_t drafts : {1U, 0U}) {
        device.clock.advance(1s);
        EXPECT_EQ(draftsOf(6.0), drafts);
        EXPECT_TRUE(isTimeKept());
    }
    EXPECT_EQ(device.bugReportDrafting.requests.front().processName, "");
    EXPECT_EQ(loggedLevels(ZRReportingSessionCategory()), "es") << "the rubbish, the draft";
}

TEST_F(CaptureTest, CapturesOverloadsOfLargeBuffersAndCycles) {
    EXPECT_FALSE(isCaptured(*tryToMake<Worker>(), overload, 6, 0x08000007));
    EXPECT_FALSE(isCaptured(*tryToMake<Worker>(), overload, 5, 7));
    const struct {
        Value leastSize; ///< preferences
        Value leastCycle;
        Dictionary payload;
        bool isCaptured;
    } cases[] = {
        {0, 0, {{kSize, 511}}, false},
        {0, 0, {{kSize, 512}}, true},
        {"64", 0, {{kSize, 63.9}}, false},
        {"64", 0, {{kSize, "64"}}, true},
        {-1, 0, {}, true},
        {1, 0, {}, false},
        {std::int64_t{1} << 40, 0, {{kSize, std::int64_t{1} << 32}}, true},
        {1, 3, {{kSize, 1}, {kCycle, 2}}, false},
        {1, 3, {{kSize, 1}, {kCycle, 3}}, true},
        {1, -1, {{kSize, 1}, {kCycle, -2}}, false},
    };
    for (const auto& [leastSize, leastCycle, payload, isToBeCaptured] : cases) {
        prefer("io_buffer_size", leastSize);
        prefer("io_cycle", leastCycle);
        EXPECT_EQ(isCaptured(*tryToMake<Worker>(), payload), isToBeCaptured)
            << jsonText(leastSize) << jsonText(leastCycle) << jsonText(payload);
    }
}

TEST_F(CaptureTest, NamesTheApplicationAndWaitsForMoreThanTenSeconds) {
    const auto worker = tryToMake<Worker>();
    Dictionary payload = overload;
    payload.set("HostApplicationDisplayID", "com.a");
    EXPECT_TRUE(isCaptured(*worker, payload));
    device.clock.advance(10s);
    EXPECT_FALSE(isCaptured(*worker, overload));
    EXPECT_TRUE(isCaptured(*tryToMake<Worker>(), overload)) << "each worker counts for itself";
    device.clock.advance(500ms);
    EXPECT_TRUE(isCaptured(*worker, overload));
    const auto& requests = device.diagnosticCapture.requests;
    EXPECT_EQ(requests[0].payload, payload);
    EXPECT_EQ(requests[0].reason, "com.a");
    EXPECT_EQ(requests[1].reason, "(null)");
    EXPECT_THAT(device.namedNotifications.posted,
                ElementsAreArray(std::vector<std::string>(3, "com.vandra.tamblo.dropped-stackburst")));
}

TEST_F(CaptureTest, WaitsAsLongAsWantedAndTheServerQueueMayThenBlock) {
    const std::pair<Value, std::int64_t> cases[] = {
        {0.9, 0}, {1'500'000.9, 1'500'000}, {-1, 0}, {4'294'967'296.0, 4'294'967'295}, {std::nan(""), 0}};
    for (const auto& [preference, microseconds] : cases) {
        prefer("wait_time", preference);
        const auto worker = tryToMake<Worker>();
        const WallTime before = device.clock.now();
        EXPECT_TRUE(isCaptured(*worker, overload));
        EXPECT_EQ(device.clock.now() - before, std::chrono::microseconds(microseconds));
        EXPECT_EQ(device.serverQueue().mayBlock, microseconds != 0) << microseconds;
    }
}

TEST_F(CaptureTest, AValueOfTheWrongKindIsOneErrorLineUntilItChanges) {
    const std::pair<Value, const char*> cases[] = {
        // one line: it is no number; two: nor is it a flag
        {" -.5", ""}, {"NO", "e"}, {"true", "e"}, {"", "ee"}, {Array{1}, "ee"},
        {"7 x", ""},  {"NO", "e"}, {"-", "ee"},   {1.5, ""},  {Value::date(1), "ee"}};
    for (const auto& [value, levels] : cases) {
        prefer("io_cycle", value);
        prefer("enable_stackburst", value);
        (void)loggedLevels(ZRReportingDPLogCategory());
        for (int reading = 0; reading < 2; ++reading) {
            EXPECT_EQ(Worker::getRunTimeDefaults(device.context(), "io_cycle"), value.integerValue());
            EXPECT_EQ(Worker::getEnableFlag(device.context(), "enable_stackburst"), value.boolValue());
        }
        EXPECT_EQ(loggedLevels(ZRReportingDPLogCategory()), levels) << jsonText(value);
    }
}

} // namespace
} // namespace tamblo
