#include "platform/linux/device/ProcessFiles.h"
#include "platform/linux/device/LinuxProcessSampling.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <chrono>
#include <thread>

#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;
using testing::UnorderedElementsAre;

class ProcessFilesTest : public testing::Test {
protected:
    void write(const std::string& name, const std::string& text) const {
        std::filesystem::create_directories(std::filesystem::path(root.path(name)).parent_path());
        root.write(name, text);
    }

    TemporaryDirectory root;
    const ProcessFiles files{root.path()};
};

/// Fields 3 to 24, each with its number in place of a value.
const std::string kFields = "S 4 5 6 7 -8 9 10 11 12 13 140 15 16 17 18 19 20 21 22 23 24";

TEST_F(ProcessFilesTest, UseIsReadBehindWhateverTheProcessCallsItself) {
    const struct {
        std::string stat;
        bool isRead;
    } cases[] = {
        {"7 (a) " + kFields + " 25\n", true},
        {"7 (a b) S 1 (c)\n(d) " + kFields, true},
        {"7 (a) " + kFields.substr(0, kFields.size() - 3), false},
        {"7 " + kFields + " 25\n", false},
        {"", false},
        {") ", false},
    };
    const auto page = static_cast<std::uint64_t>(::sysconf(_SC_PAGESIZE));
    const auto tick = std::chrono::microseconds(1'000'000 / ::sysconf(_SC_CLK_TCK));
    write("7/task/7/status", "Name:\ta\nvoluntary_ctxt_switches:\t3\nnonvoluntary_ctxt_switches:\t5\n");
    write("7/task/8/status", "Name:\tb\nvoluntary_ctxt_switches:\t30\nnonvoluntary_ctxt_switches:\t50\n");
    write("7/task/9/status", "Name:\tc");
    for (const auto& row : cases) {
        write("7/stat", row.stat);
        const auto sample = files.sample(7);
        ASSERT_EQ(sample.has_value(), row.isRead) << row.stat;
        if (sample) {
            EXPECT_EQ(sample->minorFaults, 10U);
            EXPECT_EQ(sample->majorFaults, 12U);
            EXPECT_EQ(sample->userTime, 140 * tick);
            EXPECT_EQ(sample->systemTime, 15 * tick);
            EXPECT_EQ(sample->threads, 20U);
            EXPECT_EQ(sample->residentBytes, 24 * page);
            EXPECT_EQ(sample->voluntarySwitches, 33U);
            EXPECT_EQ(sample->involuntarySwitches, 55U);
        }
    }
    EXPECT_FALSE(files.sample(6) || files.sample(0) || files.sample(-1));
}

TEST_F(ProcessFilesTest, ThreadsAreThoseThatHaveNumbersUpToTheLimit) {
    for (const char* name : {"7", "12", "13", "self", "-3", "99999999999"}) {
        write(std::string("7/task/") + name + "/comm", std::string("t") + name + "\n");
    }
    EXPECT_THAT(files.threads(7), UnorderedElementsAre(7, 12, 13));
    EXPECT_THAT(files.threads(7, 3), SizeIs(3));
    EXPECT_THAT(files.threads(7, 2), SizeIs(2));
    EXPECT_THAT(files.threads(7, 0), IsEmpty());
    EXPECT_THAT(files.threads(8), IsEmpty());
    EXPECT_EQ(files.threadName(7, 12), "t12");
    write("7/task/13/comm", "caf\xC3\n");
    EXPECT_EQ(files.threadName(7, 13), "caf") << "cut within its last character";
    EXPECT_EQ(files.threadName(7, 14), std::nullopt);
}

TEST_F(ProcessFilesTest, AThreadIsSampledAsFarAsItMayBeLookedAt) {
    write("7/task/7/status", "Name:\tState: X\\n\nState:\tD (disk sleep)\nTgid:\t7\n");
    auto sample = files.sampleThread(7, 7);
    ASSERT_TRUE(sample);
    EXPECT_EQ(sample->state, "D (disk sleep)");
    EXPECT_EQ(sample->waitChannel, std::nullopt);
    EXPECT_EQ(sample->kernelStack, std::nullopt);

    write("7/task/7/wchan", "0");
    write("7/task/7/stack", "");
    sample = files.sampleThread(7, 7);
    EXPECT_EQ(sample->waitChannel, std::nullopt);
    EXPECT_EQ(sample->kernelStack, std::vector<std::string>{}) << "a running thread";

    write("7/task/7/wchan", "io_schedule");
    write("7/task/7/stack", "[<0>] io_schedule+0x46/0x70\n[<ffffffff8>] f [mod]\ntorn\xFF");
    sample = files.sampleThread(7, 7);
    EXPECT_EQ(sample->waitChannel, "io_schedule");
    EXPECT_THAT(*sample->kernelStack, ElementsAre("io_schedule+0x46/0x70", "f [mod]", "torn"));

    write("7/task/7/status", "Name:\ta\n");
    EXPECT_FALSE(files.sampleThread(7, 7));
    EXPECT_FALSE(files.sampleThread(7, 8));
}

TEST_F(ProcessFilesTest, MemoryIsInBytesAndOnlyOfThoseThatHaveAny) {
    write("7/status",
          "Name:\tVmRSS: 9\nVmLck:\t       1 kB\nVmHWM:\t  20 kB\nVmRSS:\t 10 kB\nRssAnon:\t5 kB\n"
          "RssFile:\t3 kB\nRssShmem:\t2 kB\nVmPTE:\t6 kB\nVmSwap:\tmuch\nThreads:\t4\n");
    const auto memory = files.memory(7);
    ASSERT_TRUE(memory);
    EXPECT_THAT(
        (std::vector{memory->resident, memory->peakResident, *memory->anonymous, memory->file, memory->shared,
                     memory->swapped, memory->locked, memory->pageTables, memory->threads}),
        ElementsAre(10240, 20480, 5120, 3072, 2048, 0, 1024, 6144, 4));
    write("8/status", "Name:\tkworker\nState:\tI (idle)\nThreads:\t1\n");
    EXPECT_FALSE(files.memory(8));
    EXPECT_FALSE(files.memory(9));

    EXPECT_FALSE(files.kernelMemory());
    write("meminfo", "MemTotal: 9 kB\nUnevictable: 1 kB\nMlocked: 2 kB\nSlab: 3 kB\nSReclaimable: 4 kB\n"
                     "SUnreclaim: 5 kB\nKernelStack: 6 kB\nPageTables: 7 kB\nSecPageTables: 8 kB\n");
    const auto kernel = files.kernelMemory();
    EXPECT_THAT((std::vector{kernel->unevictable, kernel->locked, kernel->slab, kernel->slabReclaimable,
                             kernel->slabUnreclaimable, kernel->kernelStack, kernel->pageTables}),
                ElementsAre(1024, 2048, 3072, 4096, 5120, 6144, 7168));
}

/// Its state once it is this one, or after a few seconds.
ProcessFiles::ThreadSample awaitState(const ProcessFiles& files, pid_t pid, char state) {
    auto sample = files.sampleThread(pid, pid);
    for (int i = 0; i < 300 && (!sample || sample->state.front() != state); ++i) {
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
        sample = files.sampleThread(pid, pid);
    }
    return sample.value_or(ProcessFiles::ThreadSample());
}

TEST(ProcessFilesOfTheKernel, FollowAProcessFromItsWaitToItsEnd) {
    const ProcessFiles files;
    int ends[2];
    ASSERT_EQ(::pipe(ends), 0);
    const pid_t child = ::fork();
    if (child == 0) {
        char byte = 0;
        ::close(ends[1]);
        ::_exit(static_cast<int>(::read(ends[0], &byte, 1)));
    }
    const auto waiting = awaitState(files, child, 'S');
    EXPECT_EQ(waiting.state, "S (sleeping)");
    EXPECT_THAT(waiting.waitChannel.value_or("pipe_read"), HasSubstr("pipe_read"));
    if (waiting.kernelStack) {
        EXPECT_THAT(*waiting.kernelStack, testing::Contains(HasSubstr("pipe_read+0x")));
    }
    // The thread sanitizer's runtime has one of its own in each process.
    const std::vector<pid_t> threads = files.threads(child);
    EXPECT_THAT(threads, testing::Contains(child));
    EXPECT_EQ(files.threadName(child, child), files.name(::getpid()));
    const auto sample = LinuxProcessSampling().sample(child);
    const auto memory = files.memory(child);
    EXPECT_TRUE(sample && sample->residentBytes > 0 && sample->threads == threads.size());
    EXPECT_TRUE(memory && *memory->anonymous + memory->file + memory->shared == memory->resident);

    ::close(ends[0]);
    ::close(ends[1]);
    EXPECT_EQ(awaitState(files, child, 'Z').state, "Z (zombie)");
    EXPECT_FALSE(files.memory(child));
    ::waitpid(child, nullptr, 0);
    EXPECT_FALSE(files.sampleThread(child, child) || files.sample(child) || files.name(child));
}

} // namespace
} // namespace tamblo
