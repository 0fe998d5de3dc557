#include "tests/workers/WorkerTest.h"
#include "workers/trace/ChromeTrace.h"
#include "workers/trace/ProcessSampler.h"
#include "workers/trace/SessionTrace.h"
#include "workers/trace/ZRReportingSessionTraceWorker.h"

#include <nlohmann/json.hpp>

#include <limits>
#include <map>
#include <span>

namespace tamblo {
namespace {

using namespace std::chrono_literals;
using Json = nlohmann::json;
using testing::IsEmpty;
using testing::SizeIs;

constexpr const char* kPath = "/performance/20260301-120000+0000-5-Unknown-velka.json";
constexpr pid_t kService = 4321;
constexpr std::int64_t kStart = 1'772'366'400'000'000; ///< of the fake clock, in microseconds
const WallTime kStartTime{std::chrono::microseconds(kStart)};

ProcessSample sampleOf(std::int64_t userMicroseconds, std::uint64_t faults = 0) {
    ProcessSample sample;
    sample.userTime = std::chrono::microseconds(userMicroseconds);
    sample.voluntarySwitches = 3;
    sample.minorFaults = faults;
    sample.residentBytes = 1U << 20U;
    sample.threads = 2;
    return sample;
}

class TraceWorkerTest : public WorkerTest {
protected:
    TraceWorkerTest() : WorkerTest(LogLevel::info, true) { session = makeSession(AudioServiceTypeVelka); }

    /// A tick, after which the time of day has gone on by the step.
    void tick(std::chrono::milliseconds step = 100ms) {
        device.clock.advance(step);
        device.processInformation.uptime += 100ms;
        device.workQueues.elapse(100ms);
        device.workQueues.run("com.vandra.tamblo.trace.samples");
    }
    /// The performance files, whose names have the time of the stop; an internal build writes others, too.
    [[nodiscard]] std::map<std::string, std::string> written() {
        device.workQueues.run("com.vandra.tamblo.trace");
        std::map<std::string, std::string> files = std::exchange(device.reportFiles.files, {});
        std::erase_if(files, [](const auto& file) { return !file.first.starts_with("/performance/"); });
        return files;
    }
    /// "TIME:VALUE" of one counter's member, times in milliseconds from the start.
    static std::string counter(const Json& file, pid_t pid, const std::string& name, const char* member) {
        std::string found;
        for (const Json& event : file.at("traceEvents")) {
            if (event.at("ph") == "C" && event.at("pid") == pid && event.at("name") == name) {
                found += std::to_string((event.at("ts").get<std::int64_t>() - kStart) / 1000) + ":" +
                         event.at("args").at(member).dump() + " ";
            }
        }
        return found;
    }
};

TEST_F(TraceWorkerTest, WritesWhatASessionsProcessesDid) {
    device.processInformation.names[kService] = "tamblod";
    session->start();
    ASSERT_EQ(device.workQueues.delayedCalls(), 1U);
    constexpr std::int64_t kMost = std::numeric_limits<std::int64_t>::max();
    const struct {
        std::optional<std::int64_t> clientsTime;
        std::uint64_t servicesFaults;
        std::chrono::milliseconds step = 100ms;
    } ticks[] = {{1000, 10},
                 {6000, 9}, // runs backwards
                 {kMost, ~0ULL, -1h},
                 {std::nullopt, 19},
                 {1, 29}}; // another process has the client's number now
    for (const auto& t : ticks) {
        device.processSampling.set(kService, sampleOf(0, t.servicesFaults));
        device.processSampling.end(kClient);
        if (t.clientsTime) {
            device.processSampling.set(kClient, sampleOf(*t.clientsTime));
        }
        tick(t.step);
    }
    device.clock.set(kStartTime);
    session->stop();
    EXPECT_FALSE(device.reportFiles.files.contains(kPath)) << "written on the server queue";

    const auto files = written();
    ASSERT_THAT(files, SizeIs(1));
    const Json file = Json::parse(files.at(kPath));
    EXPECT_EQ(counter(file, kClient, "processor time (% of a core)", "user"), "200:5.0 ");
    EXPECT_EQ(counter(file, kClient, "memory (bytes)", "resident"), "100:1048576 200:1048576 200:1048576 ");
    EXPECT_EQ(counter(file, kService, "page faults (per second)", "minor"), "200:0.0 300:0.0 400:100.0 ");
    const Json& events = file.at("traceEvents");
    EXPECT_EQ(events.at(0).at("args").at("name"), "caller");
    EXPECT_EQ(events.at(1).at("args").at("name"), "tamblod");
    EXPECT_EQ(events.at(5).at("dur"), 3'600'000'000) << "the clock goes on from where it was";
}

TEST_F(TraceWorkerTest, HoldsSoManyTracesAtATimeAndForgetsDroppedSessions) {
    std::vector<std::shared_ptr<ZRReportingSession>> sessions;
    for (std::size_t i = 0; i < ProcessSampler::kMostRecordings + 3; ++i) {
        sessions.push_back(makeSession(AudioServiceTypeVelka, {}, static_cast<ReporterID>(i)));
        sessions.back()->start();
    }
    const auto timesFull = [this] { return device.log.count("32 sessions are traced already"); };
    EXPECT_EQ(timesFull(), 1U);
    sessions.erase(sessions.begin()); // without a stop
    sessions.back()->stop();
    sessions.back()->start();
    EXPECT_EQ(timesFull(), 1U) << "there was room for it";
    tick();
    for (const auto& traced : std::span(sessions).first(sessions.size() - 1)) {
        traced->stop();
        traced->start();
    }
    EXPECT_EQ(timesFull(), 2U) << "the files wait";
    EXPECT_THAT(written(), SizeIs(ProcessSampler::kMostRecordings - 1));
    for (int i = 0; i < 2; ++i) {
        sessions.front()->stop();
        sessions.front()->start();
    }
    sessions.back()->stop();
    EXPECT_THAT(written(), SizeIs(2)) << "though nothing was sampled";
    EXPECT_EQ(device.workQueues.delayedCalls(), 1U);
    sessions.clear();
    EXPECT_EQ(device.workQueues.delayedCalls(), 0U);
}

TEST_F(TraceWorkerTest, EachFailureIsOneLine) {
    for (const auto step : {&FakeReportFiles::directoryFailure, &FakeReportFiles::openFailure,
                            &FakeReportFiles::writeFailure, &FakeReportFiles::closeFailure}) {
        device.reportFiles.*step = "no way";
        session->start();
        session->stop();
        (void)written();
        device.reportFiles.*step = std::nullopt;
        EXPECT_EQ(loggedLevels(ZRReportingTraceCategory()), "e");
    }
}

TEST(SampleRecordingTest, KeepsEveryOtherSampleWhenItIsFull) {
    constexpr std::size_t kMost = SampleRecording::kMostSamples;
    const pid_t processes[] = {1, 2};
    SampleRecording recording(processes, WallTime());
    std::size_t looked = 0;
    for (std::size_t tick = 0; tick < 2 * kMost + 2; ++tick) {
        for (const pid_t pid : recording.nextTick()) {
            recording.add(pid, WallTime(std::chrono::seconds(tick)), sampleOf(0));
            ++looked;
        }
    }
    EXPECT_EQ(looked, 2 * (kMost + kMost / 2 + 1));
    const RecordedSamples taken = recording.take(WallTime());
    for (const RecordedSamples::Process& process : taken.processes) {
        ASSERT_EQ(process.samples.size(), kMost / 2 + 1);
        for (std::size_t i = 0; i < process.samples.size(); ++i) {
            ASSERT_EQ(process.samples[i].time, WallTime(std::chrono::seconds(4 * i)));
        }
    }
    EXPECT_THAT(recording.nextTick(), IsEmpty());
}

/// Messages in tenths of a second from the start, of a session of one second.
SessionTrace marksOf(const std::vector<std::pair<int, Dictionary>>& payloads,
                     AudioEventType type = AudioEventTypeGeneric) {
    std::vector<MessageRef> messages;
    for (auto [tenths, payload] : payloads) {
        payload.set("zrreporting_timestamp", secondsSince1970(kStartTime) + tenths / 10.0);
        messages.push_back(std::make_shared<ZRReportingSessionMessage>(payload, 0x08000001U, type));
    }
    SessionTrace trace;
    trace.recorded.begin = kStartTime;
    trace.recorded.end = kStartTime + 1s;
    addMarks(trace, messages);
    return trace;
}

TEST(SessionTraceTest, StretchesAreWhereOutputAndInputRan) {
    const Dictionary on{{"session_output_running", true}};
    const Dictionary off{{"session_output_running", "NO"}};
    const Dictionary duration{{"session_duration", 1.0}};
    const Dictionary other{{"QVSessionVolume", 0.5}};
    const struct {
        std::vector<std::pair<int, Dictionary>> messages;
        std::string output; ///< begin and end of each, in tenths
    } cases[] = {
        {{{2, on}, {3, other}, {4, on}, {5, off}, {6, off}, {7, on}}, "2-5 7-10 "},
        {{{2, on}, {4, duration}, {5, other}, {6, {{"session_output_running", 1.5}}}}, "2-4 6-10 "},
        {{{2, {{"session_output_running", true}, {"session_duration", 1.0}}}, {3, off}}, "2-3 "},
        {{{1, {{"session_input_running", true}}}, {2, off}, {3, duration}}, ""},
        // Times beyond the session, in no order, and such as are none.
        {{{-50, on}, {-20, off}, {-10, on}, {3, off}}, "0-3 "},
        {{{5, on}, {4, off}, {8, on}, {2'000'000'000, off}}, "8-10 "},
        {{{2, on}, {30, off}, {31, on}}, "2-10 "},
    };
    for (const auto& c : cases) {
        std::string found;
        for (const SessionTrace::Stretch& stretch : marksOf(c.messages).output) {
            for (const auto& [time, mark] : {std::pair(stretch.begin, "-"), {stretch.end, " "}}) {
                found +=
                    std::to_string(std::chrono::round<std::chrono::milliseconds>(time - kStartTime) / 100ms);
                found += mark;
            }
        }
        EXPECT_EQ(found, c.output);
    }
}

TEST(SessionTraceTest, IssuesAreOfTwoTypesAndLimited) {
    const std::string longest(127, 'x');
    for (const AudioEventType type : {AudioEventTypeError, AudioEventTypeIssueDetector}) {
        const SessionTrace trace = marksOf({{5, {{"issue_type", longest + "\xC3\xA9"}}}}, type);
        const Json events = Json::parse(chromeTraceText(trace).view()).at("traceEvents");
        EXPECT_EQ(events.at(4).at("name"), longest);
    }
    std::vector<std::pair<int, Dictionary>> more(SessionTrace::kMostMarks, {3, {{"issue_type", "x"}}});
    EXPECT_THAT(marksOf(more, AudioEventTypeGeneric).issues, IsEmpty());
    more.front().second.set("session_output_running", true);
    const SessionTrace full = marksOf(more, AudioEventTypeError);
    EXPECT_THAT(full.issues, SizeIs(SessionTrace::kMostMarks));
    EXPECT_THAT(full.output, IsEmpty());
    EXPECT_EQ(full.droppedMarks, 1U);
}

TEST(ChromeTraceTest, IsTheObjectForm) {
    SessionTrace trace = marksOf({{2, {{"session_output_running", true}, {"session_input_running", true}}},
                                  {3, {{"issue_type", "over\"load"}}}},
                                 AudioEventTypeError);
    trace.reporterID = 7;
    trace.serviceName = "velka";
    trace.applicationName = "a\nb";
    trace.droppedMarks = 1;
    trace.processNames = {"a\\b", ""};
    trace.recorded.processes = {
        {kClient, {{kStartTime + 100ms, sampleOf(0)}, {kStartTime + 400ms, sampleOf(100'000, 1)}}, false},
        {kService, {}, false}};
    const Json file = Json::parse(chromeTraceText(trace).view());
    EXPECT_EQ(file.at("otherData").dump(),
              R"({"applicationName":"a\nb","droppedMarks":1,"reporterID":7,"serviceName":"velka"})");
    const Json& events = file.at("traceEvents");
    ASSERT_EQ(events.size(), 16U);
    const std::pair<std::size_t, const char*> expected[] = {
        {0, R"({"args":{"name":"a\\b"},"name":"process_name","ph":"M","pid":77,"tid":77})"},
        {2, R"({"args":{"name":"output 7"},"name":"thread_name","ph":"M","pid":77,"tid":4194327})"},
        {4,
         R"({"args":{"reporterID":7,"serviceName":"velka"},"dur":1000000,"name":"session","ph":"X","pid":77,)"
         R"("tid":4194326,"ts":1772366400000000})"},
        {6, R"({"dur":800000,"name":"input","ph":"X","pid":77,"tid":4194328,"ts":1772366400200000})"},
        {7,
         R"({"args":{"category":"Session_Generic","type":"Error"},"name":"Session_Generic_Error","ph":"i",)"
         R"("pid":77,"s":"p","tid":77,"ts":1772366400200000})"},
        {13, R"x({"args":{"system":0.0,"user":33.333},"name":"processor time (% of a core)","ph":"C",)x"
             R"("pid":77,"tid":77,"ts":1772366400400000})"}};
    for (const auto& [place, event] : expected) {
        EXPECT_EQ(events.at(place).dump(), event);
    }
    EXPECT_EQ(events.at(8).at("name"), "over\"load");
    EXPECT_EQ(events.at(15).at("args").dump(), R"({"major":0.0,"minor":3.333})");
    trace.reporterID = std::numeric_limits<std::int64_t>::min() + (1 << 20) - 1;
    const Json apart = Json::parse(chromeTraceText(trace).view()).at("traceEvents");
    EXPECT_EQ(apart.at(1).at("tid"), 4'194'305 + 3 * 1'048'575) << "of another session";
}

} // namespace
} // namespace tamblo
