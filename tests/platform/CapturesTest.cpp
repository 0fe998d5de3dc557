#include "platform/linux/captures/LinuxBugCaptureService.h"
#include "platform/linux/captures/LinuxDiagnosticCapture.h"
#include "platform/linux/captures/LinuxMemoryLog.h"
#include "tests/fakes/FakeWorkQueues.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <nlohmann/json.hpp>

#include <array>
#include <cmath>
#include <limits>

#include <fcntl.h>

namespace tamblo {
namespace {

namespace fs = std::filesystem;
using namespace std::chrono_literals;
using namespace testing;

TEST(DailyAllowanceTest, LastsForADayOfUtcAndOutlivesTheProcess) {
    const TemporaryDirectory directory;
    FakeLog log;
    const std::string path = directory.path("allowance.json");
    const auto read = [&] { return DailyAllowance(SmallFile::read(path, 4096), path, log); };
    const WallTime midnight = std::chrono::sys_days(std::chrono::year(2026) / 3 / 2);
    DailyAllowance allowance = read();
    for (const WallTime time : {midnight - 1ms, midnight, midnight - 1ms}) { // the clock may be set back
        for (std::uint64_t capture = 0; capture < DailyAllowance::kCapturesADay; ++capture) {
            EXPECT_TRUE(allowance.take(time));
        }
        EXPECT_FALSE(allowance.take(time));
    }
    directory.write("allowance.json", allowance.text());
    EXPECT_FALSE(read().take(midnight - 1ms));
    EXPECT_THAT(log.take(), IsEmpty());
    for (const char* rubbish : {"[]", R"({"day":1,"captures":20})", R"({"day":"","captures":-1})"}) {
        directory.write("allowance.json", rubbish);
        EXPECT_TRUE(read().take(midnight)) << rubbish;
        EXPECT_THAT(log.take(), ElementsAre(HasSubstr(path + ": "))) << rubbish;
    }
}

class CaptureFoldersTest : public Test {
protected:
    std::vector<std::string> names() const {
        std::vector<std::string> found;
        for (const auto& entry : fs::directory_iterator(directory.path("captures"))) {
            found.push_back(entry.path().filename());
        }
        return found;
    }
    /// Of a capture asked for so much after the present.
    std::string identifier(std::chrono::nanoseconds later, std::uint64_t number = 1) const {
        return CaptureFolders::identifier(clock.now() + later, number);
    }
    std::string store(const std::string& identifier, std::size_t size = 1) {
        const CaptureFile files[] = {{"log.txt", std::string(size, 'x')}};
        folders.store(identifier, files, clock.now());
        return identifier;
    }

    TemporaryDirectory directory;
    FakeLog log;
    FakeClock clock;
    CaptureFolders folders{directory.path("captures"), log, {}, CaptureFolders::Limits{1000}};
};

TEST_F(CaptureFoldersTest, OldFoldersAndLeftoversGoWithTheNextCaptureAndNothingElse) {
    EXPECT_EQ(identifier(250ms, 0xA9F86D081), "20260301T120000.250Z-9f86d081");
    const std::string justOld = identifier(-CaptureFolders::kMaximumAge - 1ms);
    const std::string notYet = identifier(-CaptureFolders::kMaximumAge);
    const std::string link = identifier(-CaptureFolders::kMaximumAge * 2);
    const std::string strange = "20200101T000000.000Z-note";
    for (const std::string& folder : {".new-" + justOld, justOld + "/deeper", notYet, strange}) {
        fs::create_directories(directory.path("captures/" + folder));
    }
    directory.write("elsewhere/kept", "");
    for (const std::string& place : {link, justOld + "/link"}) {
        fs::create_directory_symlink(directory.path("elsewhere"), directory.path("captures/" + place));
    }
    const std::string fresh = store(identifier(0s));
    EXPECT_THAT(names(), UnorderedElementsAre(notYet, fresh, strange, link));
    EXPECT_TRUE(fs::exists(directory.path("elsewhere/kept")));
    EXPECT_EQ(directory.read("captures/" + fresh + "/log.txt"), "x");
    EXPECT_EQ(fs::status(directory.path("captures/" + fresh)).permissions(), fs::perms::owner_all);
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(CaptureFoldersTest, TheOldestGoWhenThereIsNoRoomForAllButNeverTheLatest) {
    store(identifier(-2s), 10);
    const std::string second = store(identifier(-1s), 600);
    const std::string third = store(identifier(0s), 400);
    EXPECT_THAT(names(), UnorderedElementsAre(second, third));
    directory.write("captures/" + identifier(24h) + "/log.txt", std::string(600, 'x'));
    const std::string fourth = store(identifier(0s, 2));
    EXPECT_THAT(names(), UnorderedElementsAre(third, fourth)) << "first what is of a time still to come";
    const std::string asked = identifier(0s, 3);
    clock.advance(24h * 365);
    store(identifier(0s), 600);
    store(asked, 600);
    EXPECT_THAT(names(), ElementsAre(asked)) << "however long ago it was asked for";
}

TEST_F(CaptureFoldersTest, AnOutageIsOneLineAndLeavesNoHalfFolder) {
    directory.write("captures", "in the way");
    store(identifier(0s, 1));
    store(identifier(0s, 2));
    EXPECT_THAT(log.take(),
                ElementsAre(HasSubstr("captures: cannot make it: Not a directory; captures have")));
    EXPECT_TRUE(folders.isOut());
    fs::remove(directory.path("captures"));
    const std::string stored = store(identifier(0s, 3));
    EXPECT_FALSE(folders.isOut());
    const CaptureFile impossible[] = {{"a", "b"}, {"no/such/place", ""}};
    folders.store(identifier(0s, 4), impossible, clock.now());
    EXPECT_THAT(names(), ElementsAre(stored));
    EXPECT_THAT(log.take(), ElementsAre(HasSubstr("cannot write no/such/place: No such file or directory;")));
}

/// A directory for logs and, as `proc` and `sys`, what the kernel shows: written by each test.
class CapturesTest : public Test {
protected:
    CapturesTest() { clock.set(WallTime(4s)); }
    void writeThread(const std::string& process, const std::string& thread, const std::string& state) const {
        root.write("proc/" + process + "/comm", "p" + process + "\n");
        root.write("proc/" + process + "/task/" + thread + "/comm", "t" + thread + "\n");
        root.write("proc/" + process + "/task/" + thread + "/status",
                   "Name:\tState: X\\n\nState:\t" + state + "\n");
    }
    ProcessFiles files() const { return ProcessFiles(root.path("proc")); }

    TemporaryDirectory root;
    FakeLog log;
    SinkFiles sinks{root.path(), log};
    FakeWorkQueues workQueues;
    FakeClock clock;
};

class BugCaptureServiceTest : public CapturesTest {
protected:
    /// For a process 12 that there is, and a process 13 that there is not.
    void makeService() {
        service.emplace(sinks, root.path("captures"), clock, workQueues, stderrLog, FileModes(),
                        CaptureContent(root.path("proc"), root.path("sys")));
        reporter = service->makeReporter(std::array<pid_t, 3>{12, 13, 12});
    }
    std::string identifier(std::size_t reply) const {
        const Value* found = replies.at(reply).find(glarn::kReplySessionID);
        return found != nullptr ? std::string(found->stringValue()) : "";
    }
    /// The sink's lines as "OP SESSION".
    std::vector<std::string> lines() {
        sinks.flush();
        std::vector<std::string> found;
        for (const std::string& line : test::linesOf(root.path("bug-captures.jsonl"))) {
            const auto object = nlohmann::json::parse(line);
            found.push_back(object.value("op", "") + " " + object.value("session", ""));
        }
        return found;
    }
    std::string file(std::size_t reply, const std::string& name) const {
        return root.read("captures/" + identifier(reply) + "/" + name);
    }
    std::size_t gather() { return workQueues.run("com.vandra.tamblo.bugcaptures"); }

    const FileDescriptor nowhere{::open("/dev/null", O_WRONLY)};
    LinuxStructuredLog stderrLog{nowhere.get(), "debug"};
    std::vector<Dictionary> replies;
    const std::function<void(const Dictionary&)> keep = [this](const Dictionary& reply) {
        replies.push_back(reply);
    };
    const BugCaptureSignature signature{"Tonmetry", "haptics", "Playback", "Joulery", "Unknown"};
    std::optional<LinuxBugCaptureService> service;
    std::unique_ptr<GlarnReporter> reporter;
};

TEST_F(BugCaptureServiceTest, ASnapshotIsALineOnceItsFolderIsComplete) {
    writeThread("12", "12", "S (sleeping)");
    root.write("proc/12/comm", "mu\x1bs\xC2\x9Bic\n");
    root.write("proc/12/status", "Name:\tmu\x1bsic\nVmRSS:\t  64 kB\n");
    root.write("proc/12/task/12/wchan", "futex_wait");
    root.write("proc/12/task/12/stack", "[<0>] futex_wait+0x66/0x120\n");
    fs::create_directory(root.path("proc/12/task/14"));
    root.write("proc/loadavg", "0.10 0.20 0.30 1/99 12\n");
    root.write("sys/class/thermal/thermal_zone0/type", "soc\n");
    root.write("sys/class/thermal/thermal_zone0/temp", "48500\n");
    makeService();
    ASSERT_TRUE(reporter->snapshot(signature, 0s, {{"processIDs", 12}}, keep));
    const std::string request =
        R"({"time":4.0,"op":"snapshot","session":")" + identifier(0) +
        R"(","signature":{"domain":"Tonmetry","type":"haptics","subType":"Playback","subTypeContext":"Joulery",)"
        R"("detectedProcess":"Unknown"},"duration":0.0,"payload":{"processIDs":12})";
    EXPECT_THAT(lines(), IsEmpty());
    EXPECT_FALSE(fs::exists(root.path("captures")));

    stderrLog.write(LogLevel::error, "zrrr", "the last line");
    clock.advance(500ms);
    gather();
    EXPECT_EQ(root.read("bug-captures.jsonl"), request + "}\n");
    EXPECT_EQ(file(0, "capture.json"), request + ",\"gathered\":4.5}\n");
    EXPECT_EQ(file(0, "log.txt"), "<3>zrrr the last line\n");
    EXPECT_EQ(file(0, "process-12.txt"),
              "process 12: mu?s??ic\n\n== threads\n12  t12  S (sleeping)  futex_wait\n"
              "        futex_wait+0x66/0x120\n14  gone\n\n== status\nName:\tmu?sic\nVmRSS:\t  64 kB\n\n"
              "== memory\n(No such file or directory)\n\n");
    EXPECT_EQ(file(0, "process-13.txt"), "process 13: gone\n");
    EXPECT_THAT(file(0, "system.txt"), AllOf(HasSubstr("== loadavg\n0.10 0.20 0.30 1/99 12\n\n"),
                                             HasSubstr("== temperatures\nthermal_zone0  soc  48500\n")));
}

TEST_F(BugCaptureServiceTest, ATimedSessionIsKeptUnlessItIsCancelledBeforeItsEnd) {
    makeService();
    for (const auto duration : {1min, 1min, 2min}) {
        ASSERT_TRUE(reporter->startSession(signature, duration, keep));
    }
    workQueues.elapse(59'999ms);
    gather();
    EXPECT_THAT(lines(), SizeIs(3)) << "nothing has ended by itself";
    reporter->cancelSession(identifier(1));
    reporter->cancelSession(identifier(1));
    workQueues.elapse(1ms);
    gather();
    reporter->cancelSession(identifier(0));
    service.reset();
    EXPECT_THAT(lines(),
                ElementsAre("start " + identifier(0), "start " + identifier(1), "start " + identifier(2),
                            "cancel " + identifier(1), "end " + identifier(0), "cancel " + identifier(2)));
    EXPECT_THAT(file(0, "capture.json"), HasSubstr(R"("duration":60.0,"payload":{})"));
    EXPECT_EQ(file(1, "capture.json") + file(2, "capture.json"), "");
    EXPECT_EQ(workQueues.delayedCalls(), 0U);
}

TEST_F(BugCaptureServiceTest, RequestsOutsideTheLimitsMakeNoLine) {
    makeService();
    for (const double seconds : {-0.001, std::nan(""), std::numeric_limits<double>::infinity(), 3600.001}) {
        const std::chrono::duration<double> duration(seconds);
        EXPECT_FALSE(reporter->snapshot(signature, duration, {}, keep)) << seconds;
        EXPECT_FALSE(reporter->startSession(signature, duration, keep)) << seconds;
    }
    EXPECT_THAT(replies, IsEmpty());
    EXPECT_TRUE(reporter->startSession(signature, 3600s, keep));
    for (std::uint64_t more = 1; more < DailyAllowance::kCapturesADay; ++more) {
        EXPECT_TRUE(reporter->snapshot(signature, 0s, {}, keep));
    }
    gather();
    makeService(); // a restart begins no new day
    EXPECT_TRUE(reporter->snapshot(signature, 0s, {}, keep));
    EXPECT_EQ(replies.back(), (Dictionary{{glarn::kReplySuccess, false},
                                          {glarn::kReplyReason, int{kGlarnErrorDailyLimitExceeded}}}));
    fs::rename(root.path("captures/allowance.json"), root.path("elsewhere"));
    fs::create_symlink(root.path("elsewhere"), root.path("captures/allowance.json"));
    makeService();
    EXPECT_TRUE(reporter->snapshot(signature, 0s, {}, keep));
    EXPECT_TRUE(replies.back().find(glarn::kReplySuccess)->boolValue()) << "a link is not followed";
    gather();
    EXPECT_FALSE(fs::is_symlink(root.path("captures/allowance.json")));
    EXPECT_THAT(lines(), SizeIs(22)) << "one of them for the session that the service's end has cancelled";
}

class StackCaptureTest : public CapturesTest {
protected:
    void capture(const Dictionary& payload = {}) {
        service.captureStacks({.requester = "r",
                               .captureType = "AudioOverloads",
                               .reason = "\"x\"",
                               .payload = payload,
                               .options = {1, 1, 0, 0, -1}});
    }
    std::size_t run() { return workQueues.run("com.vandra.tamblo.stackcaptures"); }
    std::string lines() const { return root.read("stack-captures.jsonl"); }

    std::vector<pid_t> clients;
    LinuxDiagnosticCapture service{sinks, clock, workQueues, [this] { return clients; }, log, files()};
};

TEST_F(StackCaptureTest, ALineHoldsTheSamplesThatEachThreadHad) {
    clients = {8, 7, 7};
    writeThread("7", "7", "S (sleeping)");
    root.write("proc/7/task/7/wchan", "pipe_read");
    root.write("proc/7/task/7/stack", "[<0>] pipe_read+0x1/0x2\n[<ffffffff8>] f [mod]\ntorn\xFF");
    writeThread("8", "9", "R (running)");
    writeThread("6", "6", "S (sleeping)");
    root.write("proc/6/task/6/wchan", "0");
    root.write("proc/6/task/6/stack", ""); // it may be looked at, and is in no call
    int sleeps = 0;
    clock.whileAsleep = [&] {
        if (++sleeps == 1) {
            writeThread("8", "9", "D (disk sleep)");
            writeThread("8", "10", "R (running)");
        } else if (sleeps == 2) {
            root.write("proc/8/task/9/wchan", "io_wait");
        } else if (sleeps == 3) {
            fs::remove_all(root.path("proc/8"));
        }
    };
    capture({{"processIDs", Array{6, 5}}});
    EXPECT_EQ(lines(), "") << "nothing is read on the caller's thread";
    // Who leaves while the capture waits is looked at all the same.
    clients.clear();
    EXPECT_EQ(run(), 1U);
    EXPECT_EQ(sleeps, 4);
    EXPECT_EQ(lines(), R"({"time":4.0,"requester":"r","captureType":"AudioOverloads","reason":"\"x\"",)"
                       R"("payload":{"processIDs":[6,5]},"options":[1,1,0,0,-1],"stacks":[)"
                       R"({"process":6,"name":"p6","threads":[{"thread":6,"name":"t6","samples":[)"
                       R"-({"count":5,"state":"S (sleeping)","kernelStack":[]}]}]},)-"
                       R"({"process":8,"name":"p8","threads":[{"thread":9,"name":"t9","samples":[)"
                       R"-({"count":1,"state":"R (running)"},{"count":1,"state":"D (disk sleep)"},)-"
                       R"-({"count":1,"state":"D (disk sleep)","waitChannel":"io_wait"}]}]},)-"
                       R"({"process":7,"name":"p7","threads":[{"thread":7,"name":"t7","samples":[)"
                       R"-({"count":5,"state":"S (sleeping)","waitChannel":"pipe_read",)-"
                       R"("kernelStack":["pipe_read+0x1/0x2","f [mod]","torn"]}]}]}]})"
                       "\n");
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(StackCaptureTest, ThoseThatWaitShareASamplingAndEachHasItsLine) {
    for (const char* process : {"6", "7", "8"}) {
        writeThread(process, process, "S (sleeping)");
    }
    int sleeps = 0;
    clock.whileAsleep = [&] {
        if (++sleeps == 1) {
            capture({{"processIDs", 8}}); // while another is made
            capture();
        }
    };
    clients = {7};
    capture({{"processIDs", 6}});
    clients = {8, 6};
    capture({{"processIDs", 5}});
    EXPECT_EQ(run(), 2U);
    EXPECT_EQ(sleeps, 8);
    std::vector<std::string> processes;
    for (const std::string& line : test::linesOf(root.path("stack-captures.jsonl"))) {
        std::string& found = processes.emplace_back();
        const auto object = nlohmann::json::parse(line);
        for (const auto& process : object["stacks"]) {
            found += process["name"].get<std::string>() + process["threads"][0]["samples"].dump();
        }
    }
    const std::string samples = R"-([{"count":5,"state":"S (sleeping)"}])-";
    EXPECT_THAT(processes, ElementsAre("p6" + samples + "p7" + samples, "p8" + samples + "p6" + samples,
                                       "p8" + samples + "p6" + samples, "p8" + samples + "p6" + samples));
}

TEST_F(StackCaptureTest, ThoseBeyondWhatMayWaitAreDroppedAndCounted) {
    const Dictionary large{{"text", std::string(LinuxDiagnosticCapture::kMaximumWaitingBytes / 2, 'x')}};
    capture(large);
    capture(large); // with its key it is too much
    for (std::size_t i = 0; i < LinuxDiagnosticCapture::kMaximumWaiting; ++i) {
        capture();
    }
    EXPECT_THAT(log.take(),
                ElementsAre(HasSubstr("3 zrrl 256 stack captures, or 8388608 bytes of them, wait;")));
    EXPECT_EQ(run(), 1U);
    EXPECT_THAT(log.take(), ElementsAre("3 zrrl no stack captures wait any more; 2 were dropped"));
    capture();
    EXPECT_EQ(run(), 1U);
    EXPECT_EQ(test::linesOf(root.path("stack-captures.jsonl")).size(),
              LinuxDiagnosticCapture::kMaximumWaiting + 1);
}

TEST_F(CapturesTest, TheMemoryLogLeavesOutWhoIsGone) {
    LinuxMemoryLog memory(sinks, clock, workQueues, log, files());
    writeThread("7", "7", "S (sleeping)");
    root.write(
        "proc/7/status",
        "Name:\tVmRSS: 9\nVmPeak:\t9 kB\nVmLck:\t7 kB\nVmHWM:\t  20 kB\nVmRSS:\t 10 kB\nRssAnon:\t5 kB\n"
        "RssFile:\t3 kB\nRssShmem:\t2 kB\nVmPTE:\t6 kB\nVmSwap:\t8 kB\nThreads:\t4\n");
    writeThread("8", "8", "Z (zombie)");
    memory.logMemory(-5, {9, 8, 7}); // nothing is read on the caller's thread
    root.write("proc/meminfo",
               "MemTotal: 9 kB\nUnevictable: 1 kB\nMlocked: 2 kB\nSlab: 3 kB\nSReclaimable: 4 kB\n"
               "SUnreclaim: much\nKernelStack: 6 kB\nSecPageTables: 8 kB\nPageTables: 7 kB\n");
    EXPECT_EQ(workQueues.run("com.vandra.tamblo.memorylog"), 1U);
    EXPECT_EQ(root.read("memory-log.jsonl"),
              R"({"time":4.0,"reporter":-5,"processes":[{"process":7,"name":"p7","resident":10240,)"
              R"("peakResident":20480,"anonymous":5120,"file":3072,"shared":2048,"swapped":8192,)"
              R"("locked":7168,"pageTables":6144,"threads":4}],"kernel":{"unevictable":1024,"locked":2048,)"
              R"("slab":3072,"slabReclaimable":4096,"slabUnreclaimable":0,"pageTables":7168,)"
              R"("kernelStack":6144}})"
              "\n");
}

TEST_F(CapturesTest, OfTheMemoryRecordsThatWaitNoUserHasMoreThanAQuarter) {
    LinuxMemoryLog memory(sinks, clock, workQueues, log, files());
    const auto ask = [&memory](uid_t user, std::size_t times) {
        const LogOrigin origin(ClientIdentity{user, 1});
        for (; times != 0; --times) {
            memory.logMemory(7, {});
        }
    };
    for (int i = 0; i < 2; ++i) {
        ask(8, 256);
        ask(9, 1);
        EXPECT_EQ(workQueues.run("com.vandra.tamblo.memorylog"), 65U);
        EXPECT_THAT(log.take(), ElementsAre(HasSubstr("64 memory records of user 8 wait; further ones are"),
                                            HasSubstr("wait any more; 192 were dropped")));
    }
}

} // namespace
} // namespace tamblo
