#include "tests/workers/WorkerTest.h"
#include "workers/ReportFileName.h"
#include "workers/sinks/ZRReportingSessionSummaryJsonFileWorker.h"
#include "workers/trace/ChromeTrace.h"
#include "workers/trace/ProcessSampler.h"
#include "workers/trace/SessionTrace.h"

#include <nlohmann/json.hpp>

#include <limits>
#include <span>

// The files of whole sessions: their messages, and what their processes did.

namespace tamblo {
namespace {

using Json = nlohmann::json;

constexpr pid_t kService = 4321;

TEST(ReportFileNameTest, TellsLocalTimeAndSession) {
    const std::string longest(206, 'x');
    const std::string epoch = "19700101-000000+0000-1-";
    const struct {
        std::int64_t time;
        int offset;
        std::int64_t reporter;
        Value application;
        std::string name;
    } cases[] = {
        {1'773'476'813, -12'600, -7, "a b'\xC3\xA9", "20260314-045653-0330--7-a b'\xC3\xA9-test.json"},
        {951'782'400, 45'900, INT64_MIN, "a", "20000229-124500+1245--9223372036854775808-a-test.json"},
        // A name is one part of one file name, whatever a client sends.
        {0, 0, 1, std::string("../a\0b\n\x1F\x7F", 9), epoch + ".._a_b___-test.json"},
        {0, 0, 1, longest + std::string(17, 'y'), epoch + longest + std::string(16, 'y') + "-test.json"},
        {0, 0, 1, longest + "0123456789ABCDE\xC3\xA9", epoch + longest + "0123456789ABCDE-test.json"},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(reportFileName(WallTime(std::chrono::seconds(c.time)), std::chrono::seconds(c.offset),
                                 c.reporter, c.application, "test"),
                  c.name);
    }
}

/// On an internal build, whose sessions write both files.
class SessionFilesTest : public WorkerTest {
protected:
    SessionFilesTest() : WorkerTest(LogLevel::info, true) {
        session = makeSession(AudioServiceTypeVelka);
        worker = tryToMake<ZRReportingSessionSummaryJsonFileWorker>();
    }
    MessageRef sendVolume(Dictionary payload) {
        payload.set("zrreporting_timestamp", device.clock.seconds());
        return send(std::move(payload), AudioEventKindVolume, AudioEventTypeStart);
    }
    /// The text of the summary that the worker writes, empty when it writes none; before it, the log is
    /// empty.
    std::string summary() {
        files.files.clear();
        device.log.clear();
        worker->stop();
        return files.files.empty() ? "" : files.files.begin()->second;
    }
    /// The traces, by path.
    std::map<std::string, std::string> traces() {
        device.workQueues.run("com.vandra.tamblo.trace");
        auto found = std::exchange(files.files, {});
        std::erase_if(found, [](const auto& file) { return !file.first.starts_with("/performance/"); });
        return found;
    }

    FakeReportFiles& files = device.reportFiles;
    std::shared_ptr<ZRReportingSessionSummaryJsonFileWorker> worker;
};

TEST_F(SessionFilesTest, SummariesHaveOneObjectForEachMessage) {
    sendVolume({{"n", 1}})->isRedundant = true;
    EXPECT_EQ(summary(), "") << "without messages to write there is no file";
    const MessageRef first = sendVolume({{"n", 2}});
    sendVolume({{"n", 3}})->isSessionStarted = true;
    const auto object = [](const std::string& number, const std::string& isStarted, const std::string& n) {
        return "{\n  \"Volume_Start_" + number + "\": {\n    \"HostApplicationDisplayID\": \"Unknown\",\n" +
               "    \"audiotag\": \"VolumeStart\",\n    \"isSessionStarted\": \"" + isStarted + "\",\n" +
               "    \"n\": " + n + ",\n    \"zrreporting_timestamp\": 1772366400.0\n  }\n}\n";
    };
    const std::string both = "[\n" + object("1", "NO", "2") + ",\n" + object("2", "YES", "3") + "]\n";
    EXPECT_EQ(summary(), both);
    EXPECT_EQ(*first->payload().find("isSessionStarted"), Value("NO")) << "later workers see it";

    device.clock.advance(1s);
    device.clock.offset = 2h;
    EXPECT_EQ(summary(), both) << "the next file counts anew";
    EXPECT_EQ(files.files.begin()->first, "/reports/20260301-140001+0200-5-Unknown-velka.json");
    for (const AudioEventCategory category : {0x0800000EU, 99U, 0xFFFFFFFFU}) {
        send({{"n", category}}, category, 8);
    }
    std::string names;
    for (const auto& written : nlohmann::ordered_json::parse(summary())) {
        names += written.begin().key() + " ";
    }
    EXPECT_EQ(names, "Volume_Start_1 Volume_Start_2 Session_Volume_Joulery_1 Undefined_Joulery_1 "
                     "Undefined_Joulery_2 ");
    sendVolume({{"x", INFINITY}});
    EXPECT_TRUE(summary().ends_with("}\n,\n]\n")) << "what has no form leaves its separator";
}

TEST_F(SessionFilesTest, EachFailedStepIsTold) {
    const struct {
        std::optional<std::string> FakeReportFiles::*failure;
        const char* told;
        bool wrote;
    } cases[] = {
        {&FakeReportFiles::directoryFailure, "eii", true},
        {&FakeReportFiles::openFailure, "e", false},
        {&FakeReportFiles::writeFailure, "iei", false},
        {&FakeReportFiles::closeFailure, "ie", true},
    };
    for (const auto& c : cases) {
        session->start();
        sendVolume({{"n", 1}});
        files.*c.failure = "no way";
        EXPECT_EQ(Json::accept(summary()), c.wrote);
        EXPECT_EQ(loggedLevels(ZRReportingSessionCategory()), c.told);
        session->stop();
        (void)traces();
        EXPECT_EQ(loggedLevels(ZRReportingTraceCategory()), "e") << c.told;
        files.*c.failure = std::nullopt;
    }
}

TEST_F(SessionFilesTest, SummariesAreWrittenInPiecesAndAnOutageIsToldOnce) {
    for (int i = 0; i < 2000; ++i) {
        sendVolume({{"n", i}, {"text", std::string(1000, 'x')}});
    }
    EXPECT_EQ(Json::parse(summary()).size(), 2000U);
    const auto pieces = std::exchange(files.writes, {});
    EXPECT_THAT(pieces, SizeIs(testing::AllOf(testing::Ge(6U), testing::Le(40U))));
    EXPECT_THAT(pieces, testing::Each(testing::Le(512U << 10U)));
    files.writeFailure = "disk full";
    (void)summary();
    EXPECT_EQ(loggedLevels(ZRReportingSessionCategory()), "iei");
    EXPECT_THAT(files.writes, SizeIs(pieces.size()));
}

ProcessSample sampleOf(std::int64_t userMicroseconds, std::uint64_t faults = 0) {
    ProcessSample sample;
    sample.userTime = std::chrono::microseconds(userMicroseconds);
    sample.minorFaults = faults;
    sample.residentBytes = 1U << 20U;
    return sample;
}

TEST_F(SessionFilesTest, TracesTellWhatASessionsProcessesDid) {
    session->start();
    constexpr std::int64_t most = std::numeric_limits<std::int64_t>::max();
    playWords("c1000 s10 tick c6000 s9 tick c-most s-most back tick c-ends s19 tick c1 s29 tick",
              {{"c-most", [&] { device.processSampling.samples[kClient] = sampleOf(most); }},
               {"s-most", [&] { device.processSampling.samples[kService] = sampleOf(0, ~0ULL); }},
               {"c-ends", [&] { device.processSampling.samples.erase(kClient); }},
               {"back", [&] { device.clock.advance(-1h - 100ms); }},
               {"tick",
                [&] {
                    device.clock.advance(100ms);
                    device.processInformation.uptime += 100ms;
                    device.workQueues.elapse(100ms);
                    device.workQueues.run("com.vandra.tamblo.trace.samples");
                }}},
              [&](const std::string& word) {
                  const int number = std::stoi(word.substr(1));
                  device.processSampling.samples[word[0] == 'c' ? kClient : kService] =
                      word[0] == 'c' ? sampleOf(number) : sampleOf(0, number);
              });
    device.clock.set(kStart);
    session->stop();
    const std::string path = "/performance/20260301-120000+0000-5-Unknown-velka.json";
    EXPECT_FALSE(files.files.contains(path)) << "written on a queue of its own";
    const auto found = traces();
    ASSERT_THAT(found, SizeIs(1));
    const Json events = Json::parse(found.at(path)).at("traceEvents");
    /// "TIME:VALUE" of one counter's member, times in milliseconds from the start.
    const auto counter = [&events](pid_t pid, const std::string& name, const char* member) {
        std::string values;
        for (const Json& event : events) {
            if (event.at("ph") == "C" && event.at("pid") == pid && event.at("name") == name) {
                const auto time = std::chrono::microseconds(event.at("ts").get<std::int64_t>());
                values += std::to_string((time - kStart.time_since_epoch()) / 1ms) + ":" +
                          event.at("args").at(member).dump() + " ";
            }
        }
        return values;
    };
    EXPECT_EQ(counter(kClient, "processor time (% of a core)", "user"), "200:5.0 ");
    EXPECT_EQ(counter(kClient, "memory (bytes)", "resident"), "100:1048576 200:1048576 200:1048576 ");
    EXPECT_EQ(counter(kService, "page faults (per second)", "minor"), "200:0.0 300:0.0 400:100.0 ");
    EXPECT_EQ(events.at(4).at("dur"), 3'600'000'000) << "the clock goes on from where it was";
}

TEST_F(SessionFilesTest, HoldsSoManyTracesAtATimeAndForgetsDroppedSessions) {
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
    for (const auto& traced : std::span(sessions).first(sessions.size() - 1)) {
        traced->stop();
        traced->start();
    }
    EXPECT_EQ(timesFull(), 2U) << "the files wait";
    EXPECT_THAT(traces(), SizeIs(ProcessSampler::kMostRecordings - 1)) << "though nothing was sampled";
    EXPECT_EQ(device.workQueues.delayedCalls(1h), 1U);
    sessions.clear();
    EXPECT_EQ(device.workQueues.delayedCalls(1h), 0U);
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
    for (const RecordedSamples::Process& process : recording.take(WallTime()).processes) {
        ASSERT_EQ(process.samples.size(), kMost / 2 + 1);
        for (std::size_t i = 0; i < process.samples.size(); ++i) {
            ASSERT_EQ(process.samples[i].time, WallTime(std::chrono::seconds(4 * i)));
        }
    }
}

/// Of a session of ten seconds with these messages.
SessionTrace marksOf(const std::string& messages, AudioEventType type = AudioEventTypeGeneric) {
    SessionTrace trace;
    trace.recorded.begin = kStart;
    trace.recorded.end = kStart + 10s;
    MarkSearch search(trace);
    for (const MessageRef& message : messagesOf(messages, secondsSince1970(kStart), type)) {
        search.take(*message);
    }
    search.finish();
    return trace;
}

TEST(SessionTraceTest, StretchesAreWhereOutputAndInputRan) {
    const std::pair<const char*, const char*> cases[] = {
        {"2 out; 3 volume=0.5; 4 out; 5 out=NO; 6 out=false; 7 out", "2-5 7-10 "},
        {"2 out; 4 length=1; 5 volume=0.5; 6 out=1.5", "2-4 6-10 "},
        // Times beyond the session, in no order, and such as are none.
        {"-50 out; -20 out=false; -10 out; 3 out=false", "0-3 "},
        {"5 out; 4 out=false; 8 out; 1e300 out=false", "8-10 "},
        {"nan out; - out; 1 out=false; 2 out; 30 out=false; 31 out", "0-1 2-10 "},
    };
    for (const auto& [messages, output] : cases) {
        std::string found;
        for (const SessionTrace::Stretch& stretch : marksOf(messages).output) {
            found += std::to_string((stretch.begin - kStart) / 1s) + "-" +
                     std::to_string((stretch.end - kStart) / 1s) + " ";
        }
        EXPECT_EQ(found, output) << messages;
    }
}

TEST(SessionTraceTest, IssuesAreLimited) {
    EXPECT_THAT(marksOf("5 issue_type=x", AudioEventTypeIssueDetector).issues, SizeIs(1));
    std::string many = "3 out";
    for (std::size_t i = 1; i < SessionTrace::kMostMarks; ++i) {
        many += ";3";
    }
    const SessionTrace full = marksOf(many, AudioEventTypeError);
    EXPECT_THAT(full.issues, SizeIs(SessionTrace::kMostMarks));
    EXPECT_THAT(full.output, IsEmpty());
    EXPECT_EQ(full.droppedMarks, 1U);
}

TEST(ChromeTraceTest, IsTheObjectForm) {
    const std::string longest = "\"" + std::string(126, 'x');
    SessionTrace trace = marksOf("2 out in; 3 issue_type=" + longest + "\xC3\xA9", AudioEventTypeError);
    trace.reporterID = 7;
    trace.serviceName = "velka";
    trace.applicationName = "a\nb";
    trace.droppedMarks = 1;
    trace.processNames = {"a\\b", ""};
    trace.recorded.processes = {
        {kClient, {{kStart + 100ms, sampleOf(0)}, {kStart + 400ms, sampleOf(100'000, 1)}}, false},
        {kService, {}, false}};
    const Json file = Json::parse(chromeTraceText(trace).view());
    EXPECT_EQ(file.at("otherData").dump(),
              R"({"applicationName":"a\nb","droppedMarks":1,"reporterID":7,"serviceName":"velka"})");
    const Json& events = file.at("traceEvents");
    ASSERT_EQ(events.size(), 16U);
    const std::pair<std::size_t, const char*> expected[] = {
        {0, R"({"args":{"name":"a\\b"},"name":"process_name","ph":"M","pid":77,"tid":77})"},
        {2, R"({"args":{"name":"output 7"},"name":"thread_name","ph":"M","pid":77,"tid":4194327})"},
        {4, R"({"args":{"reporterID":7,"serviceName":"velka"},"dur":10000000,"name":"session","ph":"X",)"
            R"("pid":77,"tid":4194326,"ts":1772366400000000})"},
        {7, R"({"args":{"category":"Generic","type":"Error"},"name":"Generic_Error","ph":"i",)"
            R"("pid":77,"s":"p","tid":77,"ts":1772366402000000})"}};
    for (const auto& [place, event] : expected) {
        EXPECT_EQ(events.at(place).dump(), event);
    }
    EXPECT_EQ(events.at(8).at("name"), longest);
    EXPECT_EQ(events.at(15).at("args").dump(), R"({"major":0.0,"minor":3.333})");
}

} // namespace
} // namespace tamblo
