#include "bridge/pipewire/tests/PrivateSound.h"

#include <gtest/gtest.h>

#include <algorithm>

namespace tamblo::pipewire {
namespace {

using test::PrivateSound;
using test::Program;
using test::ServiceProcess;

/// Stops and starts the sound server ('s'), its session manager ('m') or the service ('t').
class ThreePrograms {
public:
    void stop(char program) {
        if (program == 's') {
            sound_.killServer();
            hasServer_ = false;
        } else if (program == 'm') {
            sound_.killManager();
        } else {
            service_.signal(SIGKILL);
            (void)service_.awaitEnd();
        }
    }
    /// The manager ends by itself without the server, and cannot start: it is then started with the server.
    void start(char program) {
        if (program == 's') {
            sound_.startServer();
            hasServer_ = true;
        } else if (program == 't') {
            service_.start();
        }
        wantsManager_ = wantsManager_ || program == 'm';
        if (hasServer_ && wantsManager_) {
            sound_.killManager();
            sound_.startManager();
            wantsManager_ = false;
        }
    }
    [[nodiscard]] std::size_t count(const std::string& event, const std::string& application) const {
        const auto lines = test::linesOf(service_.logs() / "analytics-events.jsonl");
        return static_cast<std::size_t>(std::ranges::count_if(lines, [&](const std::string& line) {
            return line.find("\"com.vandra.tamblo." + event + "\"") != line.npos &&
                   line.find("\"HostApplicationDisplayID\":\"" + application + "\"") != line.npos;
        }));
    }
    [[nodiscard]] const ServiceProcess& service() const noexcept { return service_; }
    [[nodiscard]] std::string log(const std::string& program) const { return sound_.log(program); }

private:
    PrivateSound sound_;
    ServiceProcess service_;
    bool hasServer_ = true;
    bool wantsManager_ = false;
};

TEST(PipeWireRestarts, inAnyOrderWhatRunsIsReportedOnceAndEnds) {
    for (const char* const program : {"pipewire", "wireplumber", "dbus-daemon", "pw-cli", "pw-metadata"}) {
        if (!test::isInstalled(program)) {
            GTEST_SKIP() << program << " is not installed";
        }
    }
    ThreePrograms three;
    ::setenv("RUNTIME_DIRECTORY", three.service().runtimeDirectory().c_str(), 1);
    ::setenv("CONFIGURATION_DIRECTORY",
             three.service().preferenceFile("x").parent_path().parent_path().c_str(), 1);
    // It starts before any of the three.
    std::string order = "mst";
    for (const char program : order) {
        three.stop(program);
    }
    Program bridge({PROGRAMS_DIR "/tamblo-pipewire"}, three.log("bridge"));
    do {
        SCOPED_TRACE(order);
        for (const char program : order) {
            three.start(program);
        }
        const std::string application = "after-" + order;
        Program player({PROGRAMS_DIR "/tamblo_pipewire_streams", "1", "60", "application.id=" + application});
        ASSERT_TRUE(test::eventually([&] { return three.count("Session_Playback.Start", application) == 1; }))
            << test::contentOf(three.log("bridge"));
        // The stream ends with the server; a service that is still there is told so at once.
        for (const char program : order) {
            three.stop(program);
            if (program == 's' && order.find('s') < order.find('t')) {
                EXPECT_TRUE(test::eventually(
                    [&] { return three.count("Session_Generic.Summary", application) == 1; }));
            }
        }
        EXPECT_EQ(three.count("Session_Playback.Start", application), 1U);
        EXPECT_LE(three.count("Session_Generic.Summary", application), 1U);
    } while (std::next_permutation(order.begin(), order.end()));
    EXPECT_EQ(bridge.end(), 0);
}

TEST(PipeWireStart, saysWhoDoesNotAnswerAndWaits) {
    const TemporaryDirectory directory;
    for (const char* const variable : {"RUNTIME_DIRECTORY", "CONFIGURATION_DIRECTORY", "XDG_RUNTIME_DIR"}) {
        ::setenv(variable, directory.path().c_str(), 1);
    }
    ::setenv("PIPEWIRE_REMOTE", "nobody-0", 1);
    const std::string log = directory.path("log");
    Program bridge({PROGRAMS_DIR "/tamblo-pipewire"}, log);
    ::unsetenv("PIPEWIRE_REMOTE");
    EXPECT_TRUE(test::eventually([&log] {
        const std::string said = test::contentOf(log);
        return said.find("the service does not answer at") != said.npos &&
               said.find("no sound server answers at") != said.npos;
    }));
    EXPECT_EQ(bridge.end(), 0);
}

} // namespace
} // namespace tamblo::pipewire
