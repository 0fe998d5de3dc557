#include "platform/linux/captures/LinuxDiagnosticCapture.h"
#include "platform/linux/captures/LinuxMemoryLog.h"
#include "tests/fakes/FakeClock.h"
#include "tests/fakes/FakeWorkQueues.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <map>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

/// Time stands still but for what the test does while a capture waits for its next sample.
class SamplingClock final : public Clock {
public:
    [[nodiscard]] WallTime now() const noexcept override { return WallTime(std::chrono::seconds(4)); }
    [[nodiscard]] std::chrono::seconds utcOffset(WallTime) const override { return {}; }
    void sleepFor(std::chrono::microseconds) override { betweenSamples(++sleeps); }

    int sleeps = 0;
    std::function<void(int)> betweenSamples = [](int) {};
};

class ProcessSinksTest : public testing::Test {
protected:
    void writeThread(const std::string& process, const std::string& thread, const std::string& state) const {
        root.write("proc/" + process + "/comm", "p" + process + "\n");
        root.write("proc/" + process + "/task/" + thread + "/comm", "t" + thread + "\n");
        root.write("proc/" + process + "/task/" + thread + "/status", "Name:\tt\nState:\t" + state + "\n");
    }
    void endProcess(const std::string& process) const {
        std::filesystem::remove_all(root.path("proc/" + process));
    }
    [[nodiscard]] ProcessFiles files() const { return ProcessFiles(root.path("proc")); }

    TemporaryDirectory root;
    FakeWorkQueues workQueues;
    RecordingLog log;
    SinkFiles sinks{root.path(), log};
    SamplingClock clock;
    std::vector<pid_t> clients;
};

class StackCaptureTest : public ProcessSinksTest {
protected:
    void capture(const Dictionary& payload = {}) {
        service.captureStacks({.requester = "r",
                               .captureType = "AudioOverloads",
                               .reason = "\"x\"",
                               .payload = payload,
                               .options = {1, 1, 0, 0, -1}});
    }
    std::size_t run() { return workQueues.run("com.vandra.tamblo.stackcaptures"); }
    [[nodiscard]] std::string lines() const { return root.read("stack-captures.jsonl"); }

    LinuxDiagnosticCapture service{sinks, clock, workQueues, [this] { return clients; }, log, files()};
};

TEST_F(StackCaptureTest, ALineHoldsTheSamplesThatEachThreadHad) {
    clients = {8, 7, 7};
    writeThread("7", "7", "S (sleeping)");
    root.write("proc/7/task/7/wchan", "pipe_read");
    root.write("proc/7/task/7/stack", "[<0>] pipe_read+0x1/0x2\n[<0>] vfs_read+0x3/0x4\n");
    writeThread("8", "9", "R (running)");
    writeThread("6", "6", "S (sleeping)");
    clock.betweenSamples = [&](int sleep) {
        if (sleep == 1) {
            writeThread("8", "9", "D (disk sleep)");
            writeThread("8", "10", "R (running)");
        } else if (sleep == 3) {
            endProcess("8");
        }
    };
    capture({{"processIDs", Array{6, 5}}});
    EXPECT_EQ(lines(), "") << "nothing is read on the caller's thread";
    // Who leaves while the capture waits is looked at all the same.
    clients.clear();
    EXPECT_EQ(run(), 1U);
    EXPECT_EQ(clock.sleeps, 4);
    EXPECT_EQ(lines(), R"({"time":4.0,"requester":"r","captureType":"AudioOverloads","reason":"\"x\"",)"
                       R"("payload":{"processIDs":[6,5]},"options":[1,1,0,0,-1],"stacks":[)"
                       R"({"process":6,"name":"p6","threads":[{"thread":6,"name":"t6","samples":[)"
                       R"-({"count":5,"state":"S (sleeping)"}]}]},)-"
                       R"({"process":8,"name":"p8","threads":[{"thread":9,"name":"t9","samples":[)"
                       R"-({"count":1,"state":"R (running)"},{"count":2,"state":"D (disk sleep)"}]}]},)-"
                       R"({"process":7,"name":"p7","threads":[{"thread":7,"name":"t7","samples":[)"
                       R"-({"count":5,"state":"S (sleeping)","waitChannel":"pipe_read",)-"
                       R"("kernelStack":["pipe_read+0x1/0x2","vfs_read+0x3/0x4"]}]}]}]})"
                       "\n");
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(StackCaptureTest, ThoseBeyondTheFourThatWaitAreDroppedAndCounted) {
    for (int i = 0; i < 4; ++i) {
        capture();
    }
    EXPECT_THAT(log.take(), IsEmpty());
    capture();
    capture();
    EXPECT_THAT(log.take(), ElementsAre("3 zrrp 4 stack captures wait; further ones are dropped"));
    EXPECT_EQ(run(), 4U);
    EXPECT_THAT(log.take(), ElementsAre("3 zrrp no stack captures wait any more; 2 were dropped"));
    capture();
    EXPECT_EQ(run(), 1U);
    EXPECT_THAT(log.take(), IsEmpty());
    const std::string all = lines();
    EXPECT_EQ(std::count(all.begin(), all.end(), '\n'), 5);
}

TEST_F(StackCaptureTest, AProcessWithTooManyThreadsLeavesTheOthersTheirs) {
    writeThread("7", "5000", "S (sleeping)");
    for (std::size_t i = 1; i < LinuxDiagnosticCapture::kMaximumThreads; ++i) {
        std::filesystem::create_directory_symlink("5000", root.path("proc/7/task/" + std::to_string(i)));
    }
    clients = {7};
    for (pid_t client = 6000; client < 6070; ++client) {
        clients.push_back(client);
        writeThread(std::to_string(client), std::to_string(client), "R (running)");
    }
    capture();
    run();
    std::map<int, std::size_t> threads;
    const auto line = nlohmann::json::parse(lines());
    for (const auto& process : line["stacks"]) {
        threads[process["process"].get<int>()] = process["threads"].size();
    }
    EXPECT_EQ(threads[7], LinuxDiagnosticCapture::kMaximumThreads - 70);
    EXPECT_EQ(std::count_if(threads.begin(), threads.end(), [](const auto& row) { return row.second == 1; }),
              70);
}

TEST_F(ProcessSinksTest, TheMemoryLogLeavesOutWhoIsGone) {
    LinuxMemoryLog memory(sinks, clock, workQueues, log, files());
    writeThread("7", "7", "S (sleeping)");
    root.write("proc/7/status",
               "Name:\tp7\nVmPeak:\t9 kB\nVmLck:\t1 kB\nVmHWM:\t3 kB\nVmRSS:\t2 kB\nRssAnon:\t1 kB\n"
               "RssFile:\t1 kB\nVmPTE:\t4 kB\nThreads:\t5\n");
    writeThread("8", "8", "Z (zombie)");
    memory.logMemory(-5, {9});
    EXPECT_EQ(root.read("memory-log.jsonl"), "") << "nothing is read on the caller's thread";
    EXPECT_EQ(workQueues.run("com.vandra.tamblo.memorylog"), 1U);
    memory.logMemory(-5, {9, 8, 7});
    root.write("proc/meminfo", "MemTotal: 9 kB\nSlab: 1 kB\n");
    EXPECT_EQ(workQueues.run("com.vandra.tamblo.memorylog"), 1U);
    EXPECT_EQ(root.read("memory-log.jsonl"),
              R"({"time":4.0,"reporter":-5,"processes":[],"kernel":{}})"
              "\n"
              R"({"time":4.0,"reporter":-5,"processes":[{"process":7,"name":"p7","resident":2048,)"
              R"("peakResident":3072,"anonymous":1024,"file":1024,"shared":0,"swapped":0,"locked":1024,)"
              R"("pageTables":4096,"threads":5}],"kernel":{"unevictable":0,"locked":0,"slab":1024,)"
              R"("slabReclaimable":0,"slabUnreclaimable":0,"pageTables":0,"kernelStack":0}})"
              "\n");
}

} // namespace
} // namespace tamblo
