#include "bridge/pipewire/tests/PrivateSound.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace tamblo::pipewire {
namespace {

using namespace std::chrono_literals;
using test::Program;

/// What goes wrong on a private sound server, as it stands in the sinks of a real service.
class PipeWireTroublesOnServer : public test::OnPrivateServer {
protected:
    void SetUp() override {
        OnPrivateServer::SetUp();
        if (!IsSkipped()) {
            startBridge();
        }
    }

    /// The issues of this type, which come to so many at least.
    [[nodiscard]] std::vector<Dictionary> issues(const std::string& event, const std::string& application,
                                                 std::string_view type, std::size_t count = 1) const {
        std::vector<Dictionary> found;
        (void)test::eventually([&] {
            found = events(event, application);
            std::erase_if(found, [type](const Dictionary& payload) {
                return payload.find("issue_type")->stringValue() != type;
            });
            return found.size() >= count;
        });
        return found;
    }
};

TEST_F(PipeWireTroublesOnServer, aClientThatOversleepsIsAnOverloadAtMostOnceASecond) {
    Program player(
        {PROGRAMS_DIR "/tamblo_pipewire_streams", "1", "5", "application.id=sleeper", "oversleep=150"});
    EXPECT_EQ(player.wait(), 0);
    const auto overloads = issues("IO.IssueDetector", "sleeper", "overload", 3);
    ASSERT_GE(overloads.size(), 3U);
    double before = 0;
    double late = 0;
    for (const Dictionary& overload : overloads) {
        EXPECT_GE(overload.find("zrreporting_timestamp")->doubleValue() - before, 0.99);
        before = overload.find("zrreporting_timestamp")->doubleValue();
        late += overload.find("late_number")->doubleValue();
        EXPECT_GT(overload.find("io_buffer_size")->integerValue(), 0);
    }
    // Of 1024 or 2048 frames each, 150 ms are 3 to 7 cycles, once in each of five seconds or six.
    EXPECT_GE(late, 3 * 3);
    EXPECT_LE(late, 8 * 6);
    EXPECT_EQ(events("IO.Error", "sleeper").size(), 1U);
    ASSERT_TRUE(test::eventually([this] { return !events("Session_Generic.Summary", "sleeper").empty(); }));
    EXPECT_EQ(events("Session_Generic.Summary", "sleeper")[0].find("overload_count")->integerValue(),
              static_cast<std::int64_t>(issues("IO.IssueDetector", "sleeper", "overload").size()));
    EXPECT_GE(test::linesOf(service_->logs() / "diagnostics-metrics.jsonl").size(), 3U);
}

TEST_F(PipeWireTroublesOnServer, aDeviceThatVanishesAndAStreamWithoutOneAreIssues) {
    Program player({PROGRAMS_DIR "/tamblo_pipewire_streams", "1", "60", "application.id=player"});
    ASSERT_TRUE(test::eventually([this] { return !events("Session_Playback.Start", "player").empty(); }));
    const std::string device(
        events("Session_Playback.Start", "player")[0].find("active_devices")->stringValue());
    const std::string other = device == "Speaker A" ? "Speaker B" : "Speaker A";
    const auto destroy = [this](const std::string& name) {
        const std::string node = name == "Speaker A" ? "sink-a" : "sink-b";
        (void)tamblo::test::run("timeout 5 pw-cli destroy " + sound_->nodeNamed(node));
    };
    std::this_thread::sleep_for(500ms);
    destroy(device);
    auto vanished = issues("Routing_Error.IssueDetector", "player", "device_vanished");
    ASSERT_EQ(vanished.size(), 1U);
    EXPECT_EQ(vanished[0].find("node")->stringValue(), device);
    EXPECT_TRUE(test::eventually([this] { return !events("HAL_Setup.Deactivate", "pipewire").empty(); }));
    EXPECT_TRUE(vanished[0].find("has_other_device")->boolValue());

    std::this_thread::sleep_for(500ms);
    destroy(other);
    EXPECT_EQ(issues("Routing_Error.IssueDetector", "player", "device_vanished", 2).size(), 2U);
    EXPECT_EQ(issues("Routing_Error.IssueDetector", "player", "no_device").size(), 1U);
    bridge_->end();
    EXPECT_TRUE(test::eventually([this] { return !events("Session_Generic.Summary", "pipewire").empty(); }));
}

} // namespace
} // namespace tamblo::pipewire
