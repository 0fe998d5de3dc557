#include "platform/linux/captures/LinuxBugCaptureService.h"
#include "platform/linux/loop/LinuxWorkQueues.h"
#include "tests/fakes/FakeClock.h"
#include "tests/fakes/FakeWorkQueues.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <cmath>
#include <deque>
#include <limits>
#include <map>
#include <numeric>
#include <random>
#include <thread>

#include <fcntl.h>
#include <sys/stat.h>

namespace tamblo {
namespace {

namespace fs = std::filesystem;
using namespace std::chrono_literals;
using testing::AllOf;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;
using testing::UnorderedElementsAre;

TEST(LogRingTest, HoldsTheLastLinesWithinBothLimits) {
    std::mt19937 random(7);
    for (const std::size_t longest :
         {40UL, 8192UL}) { // the first meets the limit on lines, the second on bytes
        LogRing ring;
        std::deque<std::string> expected;
        std::size_t size = 0;
        for (int added = 0; added < 5000; ++added) {
            const std::string line =
                std::string(random() % longest, static_cast<char>('a' + added % 26)) + '\n';
            ring.add(line);
            expected.push_back(line);
            size += line.size();
            while (expected.size() > LogRing::kMaximumLines || size > LogRing::kMaximumBytes) {
                size -= expected.front().size();
                expected.pop_front();
            }
            if (added % 499 == 0) {
                ASSERT_EQ(ring.text(), std::accumulate(expected.begin(), expected.end(), std::string()))
                    << added;
            }
        }
    }
}

TEST(LogRingTest, HoldsWhatPassedTheLevelAsItIsWritten) {
    const FileDescriptor nowhere(::open("/dev/null", O_WRONLY));
    LinuxStructuredLog log(nowhere.get(), "error");
    log.report(LogLevel::standard, "zrrb", "below");
    log.write(LogLevel::error, "zrrb", "line\nend");
    EXPECT_EQ(log.lastLines(), "<3>zrrb line\\nend\n");
}

TEST(DailyAllowanceTest, LastsForADayOfUtcAndOutlivesTheProcess) {
    const TemporaryDirectory directory;
    RecordingLog log;
    const std::string path = directory.path("allowance.json");
    const WallTime midnight = std::chrono::sys_days(std::chrono::year(2026) / 3 / 2);
    std::size_t taken = 0;
    for (int day = 0; day < 2; ++day) {
        for (std::uint64_t attempt = 0; attempt < DailyAllowance::kCapturesADay + 2; ++attempt) {
            DailyAllowance allowance(path, log);
            taken += allowance.take(midnight + (day == 0 ? -1ms : 0ms)) ? 1 : 0;
            directory.write("allowance.json", allowance.text());
        }
        EXPECT_EQ(taken, DailyAllowance::kCapturesADay * static_cast<std::size_t>(day + 1));
    }
    EXPECT_TRUE(DailyAllowance(path, log).take(midnight - 1ms)) << "the clock was set back";
    EXPECT_THAT(log.take(), IsEmpty());
    for (const char* rubbish :
         {"{", "[]", R"({"day":"2026-03-02"})", R"({"day":1,"captures":20})",
          R"({"day":"2026-03-02","captures":"20"})", R"({"day":"2026-03-02","captures":-1})"}) {
        directory.write("allowance.json", rubbish);
        EXPECT_TRUE(DailyAllowance(path, log).take(midnight)) << rubbish;
        EXPECT_THAT(log.take(), ElementsAre(HasSubstr(path + ": "))) << rubbish;
    }
}

class CaptureFoldersTest : public testing::Test {
protected:
    [[nodiscard]] std::vector<std::string> names() const {
        std::vector<std::string> found;
        for (const auto& entry : fs::directory_iterator(directory.path("captures"))) {
            found.push_back(entry.path().filename());
        }
        return found;
    }
    void store(const std::string& identifier, std::size_t size = 1) {
        const CaptureFile files[] = {{"log.txt", std::string(size, 'x')}};
        folders.store(identifier, files, clock.now());
    }

    TemporaryDirectory directory;
    RecordingLog log;
    FakeClock clock;
    CaptureFolders folders{directory.path("captures"), log, CaptureFolders::Limits{1000}};
};

TEST_F(CaptureFoldersTest, IdentifiersSortByTimeAndDifferByNumber) {
    const WallTime time = clock.now() + 250ms;
    EXPECT_EQ(CaptureFolders::identifier(time, 0xA9F86D081), "20260301T120000.250Z-9f86d081");
    EXPECT_EQ(CaptureFolders::identifier(time, 0), "20260301T120000.250Z-00000000");
    EXPECT_LT(CaptureFolders::identifier(time, 9), CaptureFolders::identifier(time + 1ms, 1));
}

TEST_F(CaptureFoldersTest, OldFoldersAndLeftoversGoWithTheNextCaptureAndNothingElse) {
    const std::string justOld =
        CaptureFolders::identifier(clock.now() - CaptureFolders::kMaximumAge - 1ms, 1);
    const std::string notYet = CaptureFolders::identifier(clock.now() - CaptureFolders::kMaximumAge, 2);
    const std::string fresh = CaptureFolders::identifier(clock.now(), 3);
    const std::string link = CaptureFolders::identifier(WallTime(), 4);
    const std::string strange = "20200101T000000.000Z-note";
    fs::create_directories(directory.path("captures/.new-" + justOld));
    fs::create_directories(directory.path("captures/" + justOld + "/deeper"));
    fs::create_directories(directory.path("captures/" + notYet));
    fs::create_directories(directory.path("captures/" + strange));
    fs::create_directories(directory.path("elsewhere"));
    directory.write("elsewhere/kept", "");
    fs::create_directory_symlink(directory.path("elsewhere"), directory.path("captures/" + link));
    fs::create_directory_symlink(directory.path("elsewhere"),
                                 directory.path("captures/" + justOld + "/link"));
    store(fresh);
    EXPECT_THAT(names(), UnorderedElementsAre(notYet, fresh, strange, link));
    EXPECT_TRUE(fs::exists(directory.path("elsewhere/kept")));
    EXPECT_EQ(directory.read("captures/" + fresh + "/log.txt"), "x");
    EXPECT_EQ(static_cast<unsigned>(fs::status(directory.path("captures/" + fresh)).permissions()), 0700U);
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(CaptureFoldersTest, TheOldestGoWhenThereIsNoRoomForAll) {
    std::vector<std::string> stored;
    for (const std::size_t size : {10UL, 600UL, 400UL}) { // one more than there is room for
        clock.advance(1s);
        stored.push_back(CaptureFolders::identifier(clock.now(), 1));
        store(stored.back(), size);
    }
    EXPECT_THAT(names(), UnorderedElementsAre(stored[1], stored[2]));
    clock.advance(1s);
    stored.push_back(CaptureFolders::identifier(clock.now(), 1));
    store(stored.back(), 1);
    EXPECT_THAT(names(), UnorderedElementsAre(stored[2], stored[3]));
}

TEST_F(CaptureFoldersTest, AClockThatIsSetLosesNoCaptureThatWasJustMade) {
    const std::string ahead = CaptureFolders::identifier(clock.now() + 24h, 1);
    fs::create_directories(directory.path("captures/" + ahead));
    directory.write("captures/" + ahead + "/log.txt", std::string(600, 'x'));
    const std::string first = CaptureFolders::identifier(clock.now(), 1);
    store(first, 400);
    EXPECT_THAT(names(), UnorderedElementsAre(ahead, first));
    const std::string second = CaptureFolders::identifier(clock.now(), 2);
    store(second, 1);
    EXPECT_THAT(names(), UnorderedElementsAre(first, second)) << "of a time that is still to come";
    const std::string asked = CaptureFolders::identifier(clock.now(), 3);
    clock.advance(24h * 365);
    store(asked);
    EXPECT_THAT(names(), ElementsAre(asked));
}

TEST_F(CaptureFoldersTest, AnOutageIsOneLineAndLeavesNoHalfFolder) {
    directory.write("captures", "in the way");
    store(CaptureFolders::identifier(clock.now(), 1));
    folders.keep("allowance.json", "{}");
    store(CaptureFolders::identifier(clock.now(), 2));
    EXPECT_THAT(log.take(), ElementsAre("3 zrrb " + directory.path("captures") +
                                        ": cannot make it: Not a directory; captures have no folders until "
                                        "it can be written again"));
    fs::remove(directory.path("captures"));
    const CaptureFile impossible[] = {{"a", "b"}, {"no/such/place", ""}};
    store(CaptureFolders::identifier(clock.now(), 3));
    folders.store(CaptureFolders::identifier(clock.now(), 4), impossible, clock.now());
    EXPECT_THAT(names(), ElementsAre(CaptureFolders::identifier(clock.now(), 3)));
    EXPECT_THAT(log.take(), ElementsAre(HasSubstr("cannot write no/such/place: No such file or directory;")));
    fs::create_directory(directory.path("captures/allowance.json"));
    for (std::uint64_t number = 5; number < 7; ++number) {
        folders.keep("allowance.json", "{}");
        store(CaptureFolders::identifier(clock.now(), number));
    }
    EXPECT_THAT(log.take(),
                ElementsAre(HasSubstr("cannot write allowance.json: Is a directory; the service")));
}

/// The service in a directory, with a process 12 and without a process 13.
class BugCaptureServiceTest : public testing::Test {
protected:
    BugCaptureServiceTest() {
        for (const char* folder : {"proc/12/task/12", "proc/12/task/14", "proc/pressure",
                                   "sys/class/thermal/thermal_zone0", "sys/class/thermal/cooling_device0"}) {
            fs::create_directories(directory.path(folder));
        }
        directory.write("proc/12/comm", "mu\x1bs\xC2\x9Bic\n");
        directory.write("proc/12/status", "Name:\tmu\x1bsic\nVmRSS:\t  64 kB\n");
        directory.write("proc/12/task/12/comm", "music\n");
        directory.write("proc/12/task/12/status", "Name:\tmusic\nState:\tS (sleeping)\n");
        directory.write("proc/12/task/12/wchan", "futex_wait");
        directory.write("proc/12/task/12/stack", "[<0>] futex_wait+0x66/0x120\n");
        directory.write("proc/loadavg", "0.10 0.20 0.30 1/99 12\n");
        directory.write("sys/class/thermal/thermal_zone0/type", "soc\n");
        directory.write("sys/class/thermal/thermal_zone0/temp", "48500\n");
    }

    [[nodiscard]] GlarnReporter::Reply keepReply() {
        return [this](const Dictionary& reply) { replies.push_back(reply); };
    }
    [[nodiscard]] std::string identifier(std::size_t reply) const {
        const Value* found = replies.at(reply).find(glarn::kReplySessionID);
        return found != nullptr ? std::string(found->stringValue()) : "";
    }
    /// The sink's lines without time and what is the same in all: "OP SESSION".
    [[nodiscard]] std::vector<std::string> lines() {
        sinks.flush();
        std::vector<std::string> found;
        std::istringstream text(directory.read("logs/bug-captures.jsonl"));
        for (std::string line; std::getline(text, line);) {
            const auto object = nlohmann::json::parse(line);
            found.push_back(object["op"].get<std::string>() + " " + object["session"].get<std::string>());
        }
        return found;
    }
    void makeService() {
        service.emplace(sinks, directory.path("logs/captures"), clock, queues, log,
                        CaptureContent(directory.path("proc"), directory.path("sys")));
        reporter = service->makeReporter(std::array<pid_t, 3>{12, 13, 12});
    }
    [[nodiscard]] std::string file(std::size_t reply, const std::string& name) const {
        return directory.read("logs/captures/" + identifier(reply) + "/" + name);
    }
    std::size_t gather() { return queues.run("com.vandra.tamblo.bugcaptures"); }

    TemporaryDirectory directory;
    const bool isMade = fs::create_directory(directory.path("logs"));
    const FileDescriptor nowhere{::open("/dev/null", O_WRONLY)};
    LinuxStructuredLog log{nowhere.get(), "debug"};
    SinkFiles sinks{directory.path("logs"), log};
    FakeClock clock;
    FakeWorkQueues queues;
    std::vector<Dictionary> replies;
    const BugCaptureSignature signature{"Tonmetry", "haptics", "Playback", "Joulery", "Unknown"};
    std::optional<LinuxBugCaptureService> service;
    std::unique_ptr<GlarnReporter> reporter;
};

TEST_F(BugCaptureServiceTest, ASnapshotIsALineOnceItsFolderIsComplete) {
    makeService();
    EXPECT_EQ(queues.made("com.vandra.tamblo.bugcaptures"), 0U);
    ASSERT_TRUE(reporter->snapshot(signature, 0s, {{"processIDs", 12}}, keepReply()));
    const std::string request =
        R"("op":"snapshot","session":")" + identifier(0) +
        R"(","signature":{"domain":"Tonmetry","type":"haptics","subType":"Playback","subTypeContext":"Joulery",)"
        R"("detectedProcess":"Unknown"},"duration":0.0,"payload":{"processIDs":12})";
    EXPECT_THAT(lines(), IsEmpty());
    EXPECT_FALSE(fs::exists(directory.path("logs/captures")));

    log.write(LogLevel::error, "zrrr", "the last line");
    clock.advance(500ms);
    gather();
    EXPECT_EQ(directory.read("logs/bug-captures.jsonl"), R"({"time":1772366400.0,)" + request + "}\n");
    EXPECT_EQ(file(0, "capture.json"), R"({"time":1772366400.0,)" + request +
                                           R"(,"gathered":1772366400.5})"
                                           "\n");
    EXPECT_EQ(file(0, "log.txt"), "<3>zrrr the last line\n");
    EXPECT_EQ(file(0, "process-12.txt"),
              "process 12: mu?s??ic\n\n== threads\n12  music  S (sleeping)  futex_wait\n"
              "        futex_wait+0x66/0x120\n14  gone\n\n== status\nName:\tmu?sic\nVmRSS:\t  64 kB\n\n"
              "== memory\n(No such file or directory)\n\n");
    EXPECT_EQ(file(0, "process-13.txt"), "process 13: gone\n");
    EXPECT_THAT(file(0, "system.txt"), AllOf(HasSubstr("== loadavg\n0.10 0.20 0.30 1/99 12\n\n"),
                                             HasSubstr("== temperatures\nthermal_zone0  soc  48500\n")));
}

TEST_F(BugCaptureServiceTest, ATimedSessionIsKeptUnlessItIsCancelledBeforeItsEnd) {
    makeService();
    for (int session = 0; session < 4; ++session) {
        ASSERT_TRUE(reporter->startSession(signature, session == 3 ? 2min : 1min, keepReply()));
    }
    reporter->cancelSession(identifier(1));
    reporter->cancelSession(identifier(1));
    reporter->cancelSession("20200101T000000.000Z-00000000");
    queues.elapse(59'999ms);
    reporter->cancelSession(identifier(2));
    gather();
    EXPECT_THAT(lines(), SizeIs(6)) << "nothing has ended by itself";
    queues.elapse(1ms);
    gather();
    reporter->cancelSession(identifier(0));
    service.reset();
    makeService();
    EXPECT_THAT(lines(),
                ElementsAre("start " + identifier(0), "start " + identifier(1), "start " + identifier(2),
                            "start " + identifier(3), "cancel " + identifier(1), "cancel " + identifier(2),
                            "end " + identifier(0), "cancel " + identifier(3)));
    EXPECT_THAT(file(0, "capture.json"), HasSubstr(R"("duration":60.0,"payload":{})"));
    for (const std::size_t unkept : {1UL, 2UL, 3UL}) {
        EXPECT_EQ(file(unkept, "capture.json"), "");
    }
    EXPECT_EQ(queues.delayedCalls(), 0U);
}

TEST_F(BugCaptureServiceTest, RequestsOutsideTheLimitsMakeNoLine) {
    makeService();
    const double unusable[] = {-0.001, std::nan(""), std::numeric_limits<double>::infinity(), 3600.001};
    for (const double seconds : unusable) {
        const std::chrono::duration<double> duration(seconds);
        EXPECT_FALSE(reporter->snapshot(signature, duration, {}, keepReply())) << seconds;
        EXPECT_FALSE(reporter->startSession(signature, duration, keepReply())) << seconds;
    }
    EXPECT_THAT(replies, IsEmpty());
    EXPECT_TRUE(reporter->startSession(signature, 3600s, keepReply()));
    reporter->cancelSession(identifier(0));
    for (int more = 1; more < 20; ++more) {
        EXPECT_TRUE(reporter->snapshot(signature, 0s, {}, keepReply()));
    }
    gather();
    makeService(); // a restart begins no new day
    EXPECT_TRUE(reporter->snapshot(signature, 0s, {}, keepReply()));
    EXPECT_EQ(replies.back(), (Dictionary{{glarn::kReplySuccess, false},
                                          {glarn::kReplyReason, int{kGlarnErrorDailyLimitExceeded}}}));
    gather();
    EXPECT_THAT(lines(), SizeIs(21)) << "one of them with a cancellation";
    clock.advance(12h);
    EXPECT_TRUE(reporter->snapshot(signature, 0s, {}, keepReply()));
    gather();
    EXPECT_THAT(lines(), SizeIs(22));
    service->endSessions();
    EXPECT_TRUE(reporter->startSession(signature, 1s, keepReply()));
    EXPECT_EQ(replies.back(), (Dictionary{{glarn::kReplySuccess, false},
                                          {glarn::kReplyReason, int{kGlarnErrorServiceUnavailable}}}));
}

TEST_F(BugCaptureServiceTest, AFolderThatCannotBeWrittenCostsNoLine) {
    directory.write("logs/captures", "in the way");
    makeService();
    for (int snapshot = 0; snapshot < 2; ++snapshot) {
        ASSERT_TRUE(reporter->snapshot(signature, 0s, {}, keepReply()));
        gather();
    }
    EXPECT_THAT(lines(), SizeIs(2));
    const std::string told = log.lastLines();
    EXPECT_EQ(std::count(told.begin(), told.end(), '\n'), 1) << told;
}

TEST_F(BugCaptureServiceTest, SessionsThatEndWhileTheyAreCancelledDoOneOfTheTwo) {
    std::mutex mutex;
    std::vector<std::string> started;
    {
        LinuxWorkQueues real;
        service.emplace(sinks, directory.path("logs/captures"), clock, real, log,
                        CaptureContent(directory.path("proc"), directory.path("sys")));
        std::vector<std::thread> clients;
        for (int client = 0; client < 4; ++client) {
            clients.emplace_back([&] {
                const auto own = service->makeReporter({});
                for (int session = 0; session < 5; ++session) {
                    std::string identifier;
                    EXPECT_TRUE(own->startSession(signature, 1ms, [&identifier](const Dictionary& reply) {
                        identifier = reply.find(glarn::kReplySessionID)->stringValue();
                    }));
                    own->cancelSession(session % 2 == 0 ? identifier : "");
                    const std::lock_guard lock(mutex);
                    started.push_back(identifier);
                }
            });
        }
        for (std::thread& client : clients) {
            client.join();
        }
        service->endSessions();
    }
    std::map<std::string, int> endings;
    for (const std::string& line : lines()) {
        endings[line.substr(line.find(' ') + 1)] += line.starts_with("start") ? 0 : 1;
    }
    EXPECT_THAT(started, SizeIs(20));
    for (const std::string& identifier : started) {
        EXPECT_EQ(endings[identifier], 1) << identifier;
    }
}

} // namespace
} // namespace tamblo
