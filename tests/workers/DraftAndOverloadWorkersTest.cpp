#include "base/Json.h"
#include "service/ZRReportingClientServerInstance.h"
#include "session/ZRReportingSession.h"
#include "tests/base/AllocationCount.h"
#include "tests/fakes/FakePlatform.h"
#include "util/LogCategories.h"
#include "util/ReportingServerQueue.h"
#include "workers/sinks/CapturePreferences.h"
#include "workers/sinks/ZRReportingSessionDPWorker.h"
#include "workers/sinks/ZRReportingSessionQuilletWorker.h"

#include <gmock/gmock.h>

#include <cstdint>
#include <limits>
#include <string>
#include <vector>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

constexpr const char* kDomain = "com.vandra.tamblo.zrreporting";
constexpr const char* kBackOff = "TalvixInvalidXyBackOffSeconds";
constexpr const char* kLastRun = "TalvixInvalidXyQLTlastRun";

MessageRef messageOf(Dictionary payload, AudioEventType type, AudioEventCategory category) {
    return std::make_shared<ZRReportingSessionMessage>(std::move(payload), category, type);
}

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
    /// How many drafts a message now makes, by its time after the first one's.
    std::size_t draftsOf(ZRReportingSessionQuilletWorker& worker, double offset,
                         const std::string& key = "tvac_invalid_x") {
        const std::size_t before = device.bugReportDrafting.requests.size();
        worker.handleMessage(messageOf({{key, 1}, {"zrreporting_timestamp", 1e9 + offset}}, 11, 14));
        return device.bugReportDrafting.requests.size() - before;
    }
    Value lastRun() { return device.preferences.copyPreferenceValue(kLastRun, kDomain).value_or("none"); }
};

TEST_F(QuilletWorkerTest, LooksAtMessagesFiveSecondsAfterTheFirst) {
    const struct {
        double offset;
        const char* key;
        std::size_t drafts;
    } cases[] = {{4.9, "tvac_invalid_x", 0}, {5.0, "tvac_invalid_x", 0}, {5.1, "tvac_invalid_x", 1},
                 {5.1, "tvac_invalid_", 1},  {5.1, "Tvac_invalid_x", 0}, {5.1, "tvac_invalid", 0}};
    prefer(kBackOff, 3600);
    for (const auto& [offset, key, drafts] : cases) {
        device.preferences.remove(kLastRun, kDomain);
        const auto worker = make();
        EXPECT_EQ(draftsOf(*worker, 0.0), 0U);
        EXPECT_EQ(draftsOf(*worker, offset, key), drafts) << offset << ' ' << key;
        EXPECT_EQ(lastRun(), drafts == 0 ? Value("none") : Value(device.clock.seconds())) << key;
    }
}

TEST_F(QuilletWorkerTest, OffersTheDraftAndLogsWhatCameOfIt) {
    prefer(kBackOff, 60.5);
    const auto worker = make();
    (void)draftsOf(*worker, 0.0);
    device.log.clear();
    ASSERT_EQ(draftsOf(*worker, 6.0), 1U);
    EXPECT_THAT(lines(), ElementsAre("d zrrr Quillet has not run. key=TalvixInvalidXyQLTlastRun "
                                     "backoffSeconds=60.500000",
                                     "s zrrr Starting quillet for TalvixXYerrorMessage reporterID=5"));
    const auto& [draft, process, reason, completion] = device.bugReportDrafting.requests.front();
    EXPECT_EQ(process, "caller");
    EXPECT_EQ(reason, "a Talvix spatial positioning error occurred");
    EXPECT_EQ(draft.title, "Invalid x/y coordinates during a Talvix call (QLT)");
    EXPECT_EQ(draft.problemDescription,
              "Invalid coordinates were provided to the audio layer during a Talvix call, making it "
              "impossible to render spatial audio correctly. Filing this tiklet will help determine what "
              "went wrong.");
    EXPECT_EQ(draft.component.version, "All");
    EXPECT_EQ(draft.reproducibility, 6);
    EXPECT_EQ(draft.classification, 7);
    EXPECT_THAT(draft.diagnosticExtensions, SizeIs(1));
    completion("no disk");
    completion(std::nullopt);
    EXPECT_THAT(lines(),
                ElementsAre("e zrrr Error creating draft - no disk", "i zrrr Successfully created draft"));
}

TEST_F(QuilletWorkerTest, DraftsOnceInARunAndOnceInABackOffPeriod) {
    using std::chrono::milliseconds;
    const struct {
        milliseconds elapsed;
        std::size_t drafts;
    } cases[] = {{milliseconds(59'900), 0}, {milliseconds(60'000), 1}, {milliseconds(60'100), 1}};
    prefer(kBackOff, "60 s");
    for (const auto& [elapsed, drafts] : cases) {
        device.preferences.remove(kLastRun, kDomain);
        const auto worker = make();
        (void)draftsOf(*worker, 0.0);
        EXPECT_EQ(draftsOf(*worker, 6.0), 1U);
        EXPECT_EQ(draftsOf(*worker, 7.0), 0U);
        worker->stop();
        device.clock.advance(elapsed);
        EXPECT_EQ(draftsOf(*worker, 70.0), drafts) << elapsed.count();
    }
    // Without a period, a run still has one; each message of interest moves the time on.
    prefer(kBackOff, 0);
    const auto worker = make();
    (void)draftsOf(*worker, 0.0);
    device.clock.advance(milliseconds(1));
    EXPECT_EQ(draftsOf(*worker, 6.0), 1U);
    device.clock.advance(milliseconds(1));
    device.log.clear();
    EXPECT_EQ(draftsOf(*worker, 7.0), 0U);
    EXPECT_EQ(lastRun(), Value(device.clock.seconds()));
    worker->stop();
    EXPECT_THAT(lines(), ElementsAre("d zrrr Quillet has not run. key=TalvixInvalidXyQLTlastRun "
                                     "backoffSeconds=0.000000",
                                     "d zrrr Quillet has already run for TalvixXYerrorMessage reporterID=5",
                                     "d zrrr Resetting hasRun to false. reporterID=5"));
}

TEST_F(QuilletWorkerTest, DraftsEvenWhenTheTimeCannotBeStoredOrTheSessionIsGone) {
    prefer(kBackOff, 0);
    prefer(kLastRun, Array{1});
    device.preferences.writeFailure = "disk full";
    const auto worker = make();
    (void)draftsOf(*worker, 0.0);
    session.reset();
    device.log.clear();
    for (const std::size_t drafts : {1U, 0U}) {
        device.clock.advance(std::chrono::seconds(1));
        EXPECT_EQ(draftsOf(*worker, 6.0), drafts);
    }
    EXPECT_EQ(device.bugReportDrafting.requests.front().processName, "");
    std::vector<std::string> errors = device.log.texts("preference ");
    EXPECT_THAT(errors, ElementsAre("preference com.vandra.tamblo.zrreporting TalvixInvalidXyQLTlastRun: an "
                                    "array in place of a number; it is read as 0",
                                    "preference com.vandra.tamblo.zrreporting TalvixInvalidXyQLTlastRun: "
                                    "disk full; the time of the draft is forgotten when the service ends"));
}

class DPWorkerTest : public CaptureTest<ZRReportingSessionDPWorker> {
protected:
    DPWorkerTest() { prefer("enable_stackburst", true); }

    /// Whether an overload with these is captured.
    bool isCaptured(ZRReportingSessionDPWorker& worker, const Dictionary& payload, AudioEventType type = 6,
                    AudioEventCategory category = 7) {
        const std::size_t before = device.diagnosticCapture.requests.size();
        worker.handleMessage(messageOf(payload, type, category));
        return device.diagnosticCapture.requests.size() != before;
    }
};

TEST(CaptureWorkersTest, AreThereOnInternalBuildsWhereAPreferenceWantsThem) {
    for (const bool isInternal : {false, true}) {
        FakePlatform device(LogLevel::debug, isInternal);
        const auto session = ZRReportingSession::initWithID(5, {1});
        EXPECT_EQ(ZRReportingSessionDPWorker::initWithSession(session), nullptr);
        EXPECT_EQ(ZRReportingSessionQuilletWorker::initWithSession(session), nullptr);
        EXPECT_EQ(device.log.count("TalvixInvalidXyBackOffSeconds default not set. Skipping worker. "
                                   "reporterID=5"),
                  isInternal ? 1U : 0U);
        device.preferences.set("enable_stackburst", kDomain, "YES");
        device.preferences.set(kBackOff, kDomain, 1);
        session->start();
        // The system's other workers are there in either case.
        const std::size_t withBoth = session->workerInstanceCount();
        device.preferences.remove("enable_stackburst", kDomain);
        device.preferences.remove(kBackOff, kDomain);
        const auto other = ZRReportingSession::initWithID(6, {1});
        other->start();
        EXPECT_EQ(withBoth - other->workerInstanceCount(), isInternal ? 2U : 0U);
    }
}

TEST_F(DPWorkerTest, CapturesOverloadsOfLargeBuffersAndCycles) {
    const struct {
        Value bufferSize; ///< preferences
        Value cycle;
        Dictionary payload;
        bool isCaptured;
    } cases[] = {
        {0, 0, {{"smallest_buffer_frame_size", 511}}, false},
        {0, 0, {{"smallest_buffer_frame_size", 512}}, true},
        {"64", 0, {{"smallest_buffer_frame_size", 63.9}}, false},
        {"64", 0, {{"smallest_buffer_frame_size", "64"}}, true},
        {-1, 0, {}, true},
        {1, 0, {}, false},
        {std::int64_t{1} << 40, 0, {{"smallest_buffer_frame_size", INT32_MAX}}, true},
        {1, 0, {{"smallest_buffer_frame_size", std::int64_t{1} << 32}}, true},
        {1, 3, {{"smallest_buffer_frame_size", 1}, {"io_cycle", 2}}, false},
        {1, 3, {{"smallest_buffer_frame_size", 1}, {"io_cycle", 3}}, true},
        {1, 3, {{"smallest_buffer_frame_size", 1}}, false},
        {1, -1, {{"smallest_buffer_frame_size", 1}, {"io_cycle", -2}}, false},
    };
    for (const auto& row : cases) {
        prefer("io_buffer_size", row.bufferSize);
        prefer("io_cycle", row.cycle);
        EXPECT_EQ(isCaptured(*make(), row.payload), row.isCaptured)
            << jsonText(row.bufferSize) << jsonText(row.cycle) << jsonText(row.payload);
    }
    device.preferences.remove("io_buffer_size", kDomain);
    device.preferences.remove("io_cycle", kDomain);
    const Dictionary large{{"smallest_buffer_frame_size", 512}};
    EXPECT_FALSE(isCaptured(*make(), {{"smallest_buffer_frame_size", 511}}));
    EXPECT_FALSE(isCaptured(*make(), large, 6, 0x08000007));
    EXPECT_FALSE(isCaptured(*make(), large, 5, 7));
    EXPECT_TRUE(isCaptured(*make(), large));
}

TEST_F(DPWorkerTest, CapturesAgainMoreThanTenSecondsLater) {
    const auto worker = make();
    const Dictionary overload{{"smallest_buffer_frame_size", 512}};
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
    EXPECT_THAT(lines(), testing::IsSupersetOf(
                             {"d zrrl Value of enable_stackburst is true", "d zrrl Value of io_cycle is 3"}));
    const Dictionary payload{
        {"HostApplicationDisplayID", "com.a"}, {"smallest_buffer_frame_size", 512}, {"io_cycle", 3}};
    EXPECT_TRUE(isCaptured(*worker, payload));
    EXPECT_THAT(lines(), ElementsAre("i zrrl Interested in overload",
                                     "i zrrl Dropping stackburst category=IO type=Error " + jsonText(payload),
                                     "i zrrl Dropped stackburst"));
    EXPECT_TRUE(isCaptured(*make(), {{"smallest_buffer_frame_size", 512}, {"io_cycle", 3}}));
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
    const auto message =
        messageOf({{"smallest_buffer_frame_size", 7.9}, {"io_cycle", std::int64_t{1} << 33}}, 11, 14);
    EXPECT_TRUE(isCaptured(*worker, {{"smallest_buffer_frame_size", 512}}));
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

TEST_F(DPWorkerTest, WaitsAsLongAsWantedAndMessagesAreThenPostedAsWorkThatMayBlock) {
    const struct {
        Value preference;
        std::int64_t microseconds;
    } cases[] = {{0, 0},
                 {0.9, 0},
                 {1, 1},
                 {1'500'000.9, 1'500'000},
                 {-1, 0},
                 {std::numeric_limits<double>::quiet_NaN(), 0},
                 {4'294'967'295.0, 4'294'967'295},
                 {4'294'967'296.0, 4'294'967'295},
                 {std::numeric_limits<double>::infinity(), 4'294'967'295}};
    const auto client = std::make_shared<ZRReportingClientServerInstance>(
        1, std::weak_ptr<ZRReportingServiceDelegateProtocol>());
    for (const auto& [preference, microseconds] : cases) {
        prefer("wait_time", preference);
        const auto worker = make();
        const WallTime before = device.clock.now();
        EXPECT_TRUE(isCaptured(*worker, {{"smallest_buffer_frame_size", 512}}));
        EXPECT_EQ(device.clock.now() - before, std::chrono::microseconds(microseconds));
        (void)device.serverQueue().takePaces();
        client->sendMessage({}, 4, 1, {1}, {});
        EXPECT_THAT(device.serverQueue().takePaces(),
                    ElementsAre(microseconds != 0 ? Pace::mayBlock : Pace::quick))
            << microseconds;
    }
}

TEST_F(DPWorkerTest, AValueOfTheWrongKindIsOneErrorLineUntilItChanges) {
    constexpr const char* right = "";
    const struct {
        Value value;
        const char* asNumber;
        const char* asFlag;
    } cases[] = {
        {" -.5", right, right},     {"7 x", right, right},
        {"NO", "a text", right},    {"true", "a text", right},
        {"yes!", "a text", right},  {"maybe", "a text", "a text"},
        {"", "a text", "a text"},   {Array{1}, "an array", "an array"},
        {1.5, right, right},        {Dictionary{{"a", 1}}, "a dictionary", "a dictionary"},
        {"-", "a text", "a text"},  {Value::date(1), "another value", "another value"},
        {".x", "a text", "a text"},
    };
    const auto expected = [](const char* key, const std::string& fault, const char* wanted) {
        const std::string line = std::string("preference com.vandra.tamblo.zrreporting ") + key + ": " +
                                 fault + " in place of " + wanted + "; it is read as 0";
        return fault.empty() ? std::vector<std::string>() : std::vector{line};
    };
    for (const auto& [value, asNumber, asFlag] : cases) {
        prefer("n", value);
        prefer("f", value);
        device.log.clear();
        for (int reading = 0; reading < 2; ++reading) {
            EXPECT_EQ(ZRReportingSessionDPWorker::getRunTimeDefaults("n"), value.integerValue());
            EXPECT_EQ(ZRReportingSessionDPWorker::getEnableFlag("f"), value.boolValue());
        }
        EXPECT_EQ(device.log.texts("preference com.vandra.tamblo.zrreporting n"),
                  expected("n", asNumber, "a number"));
        EXPECT_EQ(device.log.texts("preference com.vandra.tamblo.zrreporting f"),
                  expected("f", asFlag, "true or false"));
    }
}

} // namespace
} // namespace tamblo
