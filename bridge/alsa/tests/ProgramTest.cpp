#include "bridge/common/tests/Program.h"
#include "base/SplitText.h"
#include "bridge/alsa/tests/KernelTree.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <thread>

namespace tamblo::alsa {
namespace {

using namespace std::chrono_literals;
using bridge::test::Program;
using tamblo::test::contentOf;
using tamblo::test::eventually;
using test::KernelTree;

constexpr PcmName kMicrophone{.isInput = true};

double wallSeconds() {
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

/// How often a process has been woken.
long wakesOf(pid_t process) {
    const std::string status = contentOf("/proc/" + std::to_string(process) + "/status");
    std::string_view number = fieldOf(status, "voluntary_ctxt_switches").value_or("");
    return takeNumber<long>(number).value_or(-1);
}

/// The program, a service, and a device that this process opens and closes.
class AlsaProgram : public testing::Test {
protected:
    AlsaProgram() {
        std::filesystem::remove(tree_.devices());
        tree_.pcm(kMicrophone);
        ::setenv("RUNTIME_DIRECTORY", service_.runtimeDirectory().c_str(), 1);
        ::setenv("CONFIGURATION_DIRECTORY", service_.preferenceFile("x").parent_path().parent_path().c_str(),
                 1);
    }
    [[nodiscard]] std::vector<std::string> words(std::vector<std::string> more = {}) const {
        std::vector<std::string> words{PROGRAMS_DIR "/tamblo-alsa", "--proc", tree_.processes(), "--dev",
                                       tree_.devices()};
        words.insert(words.end(), more.begin(), more.end());
        return words;
    }
    [[nodiscard]] FileDescriptor open() {
        tree_.status(kMicrophone, {.state = "OPEN"});
        return FileDescriptor(::open((tree_.devices() + "/" + KernelTree::node(kMicrophone)).c_str(),
                                     O_RDONLY | O_CREAT, 0600));
    }
    void run() {
        tree_.format(kMicrophone);
        tree_.status(kMicrophone, {.trigger = wallSeconds(), .written = wallSeconds()});
    }
    [[nodiscard]] std::string line(const std::string& event) const {
        for (const std::string& line : tamblo::test::linesOf(service_.logs() / "analytics-events.jsonl")) {
            if (line.find("\"com.vandra.tamblo." + event + "\"") != line.npos &&
                line.find("\"HostApplicationDisplayID\":\"player\"") != line.npos) {
                return line;
            }
        }
        return "";
    }
    [[nodiscard]] std::string log() const { return tree_.processes() + "/../log"; }

    KernelTree tree_;
    tamblo::test::ServiceProcess service_;
};

TEST_F(AlsaProgram, hasTheServiceSumUpAStretchAndIsWokenByNothingElse) {
    Program program(words(), log());
    ASSERT_TRUE(eventually([&] { return contentOf(log()).find("reports to") != std::string::npos; }));
    // Only now there is a first card.
    std::filesystem::create_directories(tree_.devices());
    std::this_thread::sleep_for(200ms);
    const long before = wakesOf(program.pid());
    std::this_thread::sleep_for(2s);
    EXPECT_EQ(wakesOf(program.pid()), before) << "while nothing is open";

    const auto beginning = std::chrono::steady_clock::now();
    for (int i = 0; i < 3000; ++i) {
        const FileDescriptor other(::open((tree_.devices() + "/pcmC0D0c").c_str(), O_RDONLY | O_CREAT, 0600));
    }
    std::this_thread::sleep_for(100ms);
    EXPECT_LE(wakesOf(program.pid()) - before, (std::chrono::steady_clock::now() - beginning) / 10ms)
        << "however often it is opened";

    FileDescriptor device = open();
    ASSERT_TRUE(eventually([&] { return !line("Session_Setup.Setup").empty(); })) << contentOf(log());
    run();
    const auto began = std::chrono::steady_clock::now();
    ASSERT_TRUE(eventually([&] { return !line("Session_Record.Start").empty(); }));
    const long running = wakesOf(program.pid());
    std::this_thread::sleep_for(3s);
    EXPECT_LE(wakesOf(program.pid()) - running, 4);
    tree_.close(kMicrophone);
    device.reset();
    const double length = std::chrono::duration<double>(std::chrono::steady_clock::now() - began).count();
    ASSERT_TRUE(eventually([&] { return !line("Session_Generic.Stop").empty(); }));
    EXPECT_EQ(program.end(), 0);
    ASSERT_TRUE(eventually([&] { return !line("Session_Generic.Summary").empty(); })) << contentOf(log());
    const std::string summary = line("Session_Generic.Summary");
    const std::size_t at = summary.find("\"total_active_time\":");
    ASSERT_NE(at, std::string::npos) << summary;
    EXPECT_NEAR(std::stod(summary.substr(at + 20)), length, 0.2);
    EXPECT_THAT(line("Input.Summary"),
                testing::AllOf(testing::HasSubstr(R"("active_devices":"ALC257 Analog - HDA Intel PCH")"),
                               testing::HasSubstr(R"("vp_config_operation_mode":"none")")));
}

TEST_F(AlsaProgram, reportsAnewOnceWhenTheServiceIsBack) {
    std::filesystem::create_directories(tree_.devices());
    Program program(words(), log());
    const FileDescriptor device = open();
    run();
    for (std::size_t starts = 1; starts <= 2; ++starts) {
        ASSERT_TRUE(eventually(
            [&] { return service_.countEvents("com.vandra.tamblo.Session_Record.Start\"") == starts; }));
        EXPECT_EQ(service_.stop(), 0);
        EXPECT_EQ(service_.countEvents("com.vandra.tamblo.Session_Generic.Summary\""), starts);
        if (starts == 1) {
            service_.start();
        }
    }
    EXPECT_EQ(program.end(), 0);
}

TEST_F(AlsaProgram, saysWhatThereIsAndEnds) {
    tree_.status(kMicrophone, {});
    tree_.format(kMicrophone, "FLOAT_LE", 6, 96000);
    Program once(words({"--dry-run", "--once"}), log());
    EXPECT_EQ(once.wait(), 0);
    EXPECT_THAT(contentOf(log()),
                testing::AllOf(testing::StartsWith("session 1: begin, generic, of player\n"),
                               testing::HasSubstr("LPCM 96000 Hz 5.1"),
                               testing::EndsWith("session 1: end\n")));
    std::filesystem::remove_all(tree_.processes() + "/asound");
    Program nothing(words({"--dry-run", "--once"}));
    EXPECT_EQ(nothing.wait(), 1) << "there is nobody to ask";
    EXPECT_EQ(Program(words({"--proc"})).wait(), 2);
}

} // namespace
} // namespace tamblo::alsa
