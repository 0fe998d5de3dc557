#include "session/ZRReportingSession.h"
#include "tests/base/AllocationCount.h"
#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"
#include "util/LogCategories.h"
#include "workers/sinks/ZRReportingSessionDPWorker.h"
#include "workers/sinks/ZRReportingSessionQuilletWorker.h"

#include <gmock/gmock.h>

#include <cmath>
#include <cstdint>
#include <string>
#include <vector>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr const char* kDomain = "com.vandra.tamblo.zrreporting";
constexpr const char* kBackOff = "TalvixInvalidXyBackOffSeconds";
constexpr const char* kLastRun = "TalvixInvalidXyQLTlastRun";
constexpr const char* kSize = "smallest_buffer_frame_size";
constexpr const char* kCycle = "io_cycle";

template <typename Worker> class CaptureTest : public testing::Test {
protected:
    CaptureTest() {
        session->setClientProcessName("caller");
        device.log.clear();
    }

    void prefer(const std::string& key, Value value) {
        device.preferences.set(key, kDomain, std::move(value));
    }
    std::shared_ptr<Worker> make() {
        return std::static_pointer_cast<Worker>(Worker::initWithSession(session));
    }
    /// `LEVEL CATEGORY TEXT` of the lines since the last call.
    std::vector<std::string> lines() {
        std::vector<std::string> texts;
        for (const FakeLog::Line& line : device.log.lines()) {
            texts.push_back("disef"[static_cast<std::size_t>(line.level)] + (" " + line.category) + " " +
                            line.text);
        }
        device.log.clear();
        return texts;
    }

    FakePlatform device{LogLevel::debug, true};
    std::shared_ptr<ZRReportingSession> session = ZRReportingSession::initWithID(5, {1});
};

class QuilletWorkerTest : public CaptureTest<ZRReportingSessionQuilletWorker> {
protected:
    QuilletWorkerTest() {
        prefer(kBackOff, "60.5 s");
        device.clock.advance(std::chrono::milliseconds(500));
    }

    /// How many drafts a message now makes, by its time after the first one's.
    std::size_t draftsOf(double offset, const std::string& key = "tvac_invalid_x") {
        const std::size_t before = device.bugReportDrafting.requests.size();
        worker->handleMessage(messageOf({{key, 1}, {"zrreporting_timestamp", 1e9 + offset}}));
        return device.bugReportDrafting.requests.size() - before;
    }
    void arm() {
        worker = make();
        EXPECT_EQ(draftsOf(0.0), 0U);
        device.log.clear();
    }
    Value lastRun() { return device.preferences.copyPreferenceValue(kLastRun, kDomain).value_or("none"); }

    std::shared_ptr<ZRReportingSessionQuilletWorker> worker;
};

TEST_F(QuilletWorkerTest, LooksAtMessagesFiveSecondsAfterTheFirst) {
    const struct {
        double offset;
        const char* key;
        std::size_t drafts;
    } cases[] = {{5.0, "tvac_invalid_x", 0},
                 {5.1, "tvac_invalid_x", 1},
                 {5.1, "tvac_invalid_", 1},
                 {5.1, "Tvac_invalid_x", 0},
                 {5.1, "tvac_invalid", 0}};
    for (const auto& [offset, key, drafts] : cases) {
        device.preferences.remove(kLastRun, kDomain);
        arm();
        EXPECT_EQ(draftsOf(offset, key), drafts) << offset << ' ' << key;
        EXPECT_EQ(lastRun(), drafts == 0 ? Value("none") : Value(1772366400.5)) << key;
    }
}

TEST_F(QuilletWorkerTest, DraftsOnceInARunAndOnceInABackOffPeriod) {
    arm();
    EXPECT_EQ(draftsOf(6.0), 1U);
    EXPECT_EQ(draftsOf(7.0), 0U);
    const auto& [draft, process, reason, completion] = device.bugReportDrafting.requests.front();
    EXPECT_EQ(process, "caller");
    completion("no disk");
    worker->stop();
    EXPECT_THAT(lines(),
                ElementsAre("d zrrr Quillet has not run. key=TalvixInvalidXyQLTlastRun "
                            "backoffSeconds=60.500000",
                            "s zrrr Starting quillet for TalvixXYerrorMessage reporterID=5",
                            "d zrrr Quillet has run. key=TalvixInvalidXyQLTlastRun lastRun=1772366400.5",
                            "e zrrr Error creating draft - no disk",
                            "d zrrr Resetting hasRun to false. reporterID=5"));
    device.clock.advance(std::chrono::milliseconds(60'499));
    EXPECT_EQ(draftsOf(70.0), 0U);
    device.clock.advance(std::chrono::milliseconds(1));
    EXPECT_EQ(draftsOf(70.0), 1U);
}

TEST_F(QuilletWorkerTest, DraftsEvenWhenTheTimeCannotBeStoredOrTheSessionIsGone) {
    prefer(kBackOff, 0);
    prefer(kLastRun, Array{1});
    device.preferences.writeFailure = "disk full";
    arm();
    session.reset();
    // Without a period, a run still has one draft; each message of interest moves the time on.
    for (const std::size_t drafts : {1U, 0U}) {
        device.clock.advance(std::chrono::seconds(1));
        EXPECT_EQ(draftsOf(6.0), drafts);
        EXPECT_EQ(lastRun(), Value(device.clock.seconds()));
    }
    EXPECT_EQ(device.bugReportDrafting.requests.front().processName, "");
    EXPECT_EQ(device.log.count("Quillet has already run for TalvixXYerrorMessage reporterID=0"), 1U);
    EXPECT_THAT(device.log.texts("preference "),
                ElementsAre("preference com.vandra.tamblo.zrreporting TalvixInvalidXyQLTlastRun: an "
                            "array in place of a number; it is read as 0",
                            "preference com.vandra.tamblo.zrreporting TalvixInvalidXyQLTlastRun: "
                            "disk full; the time of the draft is forgotten when the service ends"));
}

TEST(CaptureWorkersTest, AreThereOnInternalBuildsWhereAPreferenceWantsThem) {
    for (const bool isInternal : {false, true}) {
        FakePlatform device(LogLevel::debug, isInternal);
        const auto workers = [](ReporterID reporterID) {
            const auto session = ZRReportingSession::initWithID(reporterID, {1});
            session->start();
            return session->workerInstanceCount();
        };
        // The system's other workers are there in either case.
        const std::size_t withNone = workers(5);
        EXPECT_EQ(device.log.count("TalvixInvalidXyBackOffSeconds default not set. Skipping worker. "
                                   "reporterID=5"),
                  isInternal ? 1U : 0U);
        device.preferences.set("enable_stackburst", kDomain, "YES");
        device.preferences.set(kBackOff, kDomain, 1);
        EXPECT_EQ(workers(6) - withNone, isInternal ? 2U : 0U);
    }
}

class DPWorkerTest : public CaptureTest<ZRReportingSessionDPWorker> {
protected:
    DPWorkerTest() { prefer("enable_stackburst", true); }

    /// Whether an overload with these is captured.
    bool isCaptured(ZRReportingSessionDPWorker& worker, const Dictionary& payload, AudioEventType type = 6,
                    AudioEventCategory category = 7) {
        const std::size_t before = device.diagnosticCapture.requests.size();
        worker.handleMessage(messageOf(payload, category, type));
        return device.diagnosticCapture.requests.size() != before;
    }

    const Dictionary overload{{kSize, 512}, {kCycle, 3}};
};

TEST_F(DPWorkerTest, CapturesOverloadsOfLargeBuffersAndCycles) {
    EXPECT_FALSE(isCaptured(*make(), {{kSize, 511}}));
    EXPECT_FALSE(isCaptured(*make(), overload, 6, 0x08000007));
    EXPECT_FALSE(isCaptured(*make(), overload, 5, 7));
    EXPECT_TRUE(isCaptured(*make(), overload));
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
        {std::int64_t{1} << 40, 0, {{kSize, INT32_MAX}}, true},
        {1, 0, {{kSize, std::int64_t{1} << 32}}, true},
        {1, 3, {{kSize, 1}, {kCycle, 2}}, false},
        {1, 3, {{kSize, 1}, {kCycle, 3}}, true},
        {1, 3, {{kSize, 1}}, false},
        {1, -1, {{kSize, 1}, {kCycle, -2}}, false},
    };
    for (const auto& [leastSize, leastCycle, payload, isToBeCaptured] : cases) {
        prefer("io_buffer_size", leastSize);
        prefer("io_cycle", leastCycle);
        EXPECT_EQ(isCaptured(*make(), payload), isToBeCaptured)
            << jsonText(leastSize) << jsonText(leastCycle) << jsonText(payload);
    }
}

TEST_F(DPWorkerTest, CapturesAgainMoreThanTenSecondsLater) {
    const auto worker = make();
    EXPECT_TRUE(isCaptured(*worker, overload));
    device.clock.advance(std::chrono::seconds(10));
    EXPECT_FALSE(isCaptured(*worker, overload));
    EXPECT_TRUE(isCaptured(*make(), overload)) << "each worker counts for itself";
    device.clock.advance(std::chrono::milliseconds(500));
    EXPECT_TRUE(isCaptured(*worker, overload));
}

TEST_F(DPWorkerTest, RequestsTheCaptureAndPostsIt) {
    prefer("io_cycle", 3);
    const auto worker = make();
    EXPECT_THAT(lines(),
                ElementsAre("d zrrl Value of enable_stackburst is true", "d zrrl Value of io_cycle is 3"));
    Dictionary payload = overload;
    payload.set("HostApplicationDisplayID", "com.a");
    EXPECT_TRUE(isCaptured(*worker, payload));
    EXPECT_THAT(lines(), ElementsAre("i zrrl Interested in overload",
                                     "i zrrl Dropping stackburst category=IO type=Error " + jsonText(payload),
                                     "i zrrl Dropped stackburst"));
    EXPECT_TRUE(isCaptured(*make(), overload));
    const auto& requests = device.diagnosticCapture.requests;
    EXPECT_EQ(requests[0].requester, "com.vandra.tamblo");
    EXPECT_EQ(requests[0].captureType, "AudioOverloads");
    EXPECT_EQ(requests[0].payload, payload);
    EXPECT_THAT(requests[0].options, ElementsAre(1, 1, 0, 0, 0));
    EXPECT_EQ(requests[0].reason, "com.a");
    EXPECT_EQ(requests[1].reason, "(null)");
    EXPECT_THAT(device.namedNotifications.posted,
                ElementsAre("com.vandra.tamblo.dropped-stackburst", "com.vandra.tamblo.dropped-stackburst"));
}

TEST_F(DPWorkerTest, TellsOfEveryOtherMessageWhenDebuggingAndElseCostsNothing) {
    const auto worker = make();
    const auto message = messageOf({{kSize, 7.9}, {kCycle, std::int64_t{1} << 33}});
    EXPECT_TRUE(isCaptured(*worker, overload));
    device.clock.advance(std::chrono::milliseconds(2500));
    device.log.clear();
    worker->handleMessage(message);
    EXPECT_THAT(lines(), ElementsAre("d zrrl Did not drop stackburst, right conditions not met: buffer size "
                                     ": 7, time diff : 2.500000, io cycle: 2147483647"));
    device.log.setThreshold(LogLevel::info);
    forgetLogThresholds();
    worker->handleMessage(message);
    EXPECT_EQ(test::allocationsOf([&] { worker->handleMessage(message); }).blocks, 0U);
    EXPECT_THAT(lines(), IsEmpty());
}

TEST_F(DPWorkerTest, WaitsAsLongAsWantedAndTheServerQueueMayThenBlock) {
    const struct {
        Value preference;
        std::int64_t microseconds;
    } cases[] = {{0.9, 0},
                 {1, 1},
                 {1'500'000.9, 1'500'000},
                 {-1, 0},
                 {4'294'967'295.0, 4'294'967'295},
                 {4'294'967'296.0, 4'294'967'295},
                 {std::nan(""), 0}};
    for (const auto& [preference, microseconds] : cases) {
        prefer("wait_time", preference);
        const auto worker = make();
        const WallTime before = device.clock.now();
        EXPECT_TRUE(isCaptured(*worker, overload));
        EXPECT_EQ(device.clock.now() - before, std::chrono::microseconds(microseconds));
        EXPECT_EQ(device.serverQueue().mayBlock, microseconds != 0) << microseconds;
    }
}

TEST_F(DPWorkerTest, AValueOfTheWrongKindIsOneErrorLineUntilItChanges) {
    const struct {
        Value value;
        unsigned faults; ///< 1: it is no number; 2: nor is it a flag
        const char* kind = "";
    } cases[] = {
        {" -.5", 0},
        {"7 x", 0},
        {"NO", 1, "a text"},
        {"true", 1, "a text"},
        {"", 2, "a text"},
        {Array{1}, 2, "an array"},
        {1.5, 0},
        {Dictionary{{"a", 1}}, 2, "a dictionary"},
        {"-", 2, "a text"},
        {Value::date(1), 2, "another value"},
        {".x", 2, "a text"},
    };
    for (const auto& [value, faults, kind] : cases) {
        prefer("n", value);
        prefer("f", value);
        device.log.clear();
        for (int reading = 0; reading < 2; ++reading) {
            EXPECT_EQ(ZRReportingSessionDPWorker::getRunTimeDefaults("n"), value.integerValue());
            EXPECT_EQ(ZRReportingSessionDPWorker::getEnableFlag("f"), value.boolValue());
        }
        const std::string preference = "preference com.vandra.tamblo.zrreporting ";
        const auto told = [&](const std::string& fault) {
            return device.log.count(preference + fault + "; it is read as 0");
        };
        EXPECT_EQ(told(std::string("n: ") + kind + " in place of a number"), faults > 0 ? 1U : 0U);
        EXPECT_EQ(told(std::string("f: ") + kind + " in place of true or false"), faults > 1 ? 1U : 0U);
        EXPECT_EQ(device.log.count(preference), faults) << jsonText(value);
    }
}

} // namespace
} // namespace tamblo
