#include "bridge/pipewire/tests/PrivateSound.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace tamblo::pipewire {
namespace {

using namespace std::chrono_literals;
using test::Program;

constexpr const char* kHeadsetNode = "bluez_output.01_23_45_67_89_AB.1";

/// What must not be found anywhere: each text that says what is played, or which piece of a device plays it,
/// has this word or one of the addresses.
constexpr const char* kSecrets = "secret|S3RIAL|01[:_-]23[:_-]45|anna";

/// On an internal build, which writes every sink there is.
class PipeWirePrivacy : public test::OnPrivateServer {
protected:
    PipeWirePrivacy() : OnPrivateServer(true) {}

    /// A headset that has no name but its address, as sound servers make them of such, until the result goes.
    [[nodiscard]] std::unique_ptr<Program> headset() const {
        const std::string node =
            "{ factory.name = support.null-audio-sink media.class = Audio/Sink audio.position = [ FL FR ]"
            " node.name = bluez_output.01_23_45_67_89_AB.1 node.description = \"Headset 01:23:45:67:89:AB\""
            " device.serial = S3RIAL api.bluez5.address = \"01:23:45:67:89:AB\" }";
        return std::make_unique<Program>(
            std::vector<std::string>{
                "sh", "-c", "(printf '%s\\n' \"create-node adapter $0\"; exec sleep 30) | exec pw-cli", node},
            sound_->log("headset"));
    }
    /// A player that says what it plays wherever it can.
    [[nodiscard]] std::vector<std::string> player(const std::string& target, const std::string& more = "") {
        return {"pw-play",
                "--target",
                target,
                "-P",
                "{ media.name = \"A secret song\" media.title = \"A secret song\" media.artist = secret"
                " media.filename = \"/home/anna/A secret song.wav\" node.description = \"A secret song\""
                " node.nick = secret window.title = \"A secret song\" application.process.user = anna"
                " application.process.host = secret media.comment = \"http://secret.example/\" " +
                    more + " }",
                sound_->song(2s)};
    }
    [[nodiscard]] std::size_t count(std::string_view event) const { return service_->countEvents(event); }
};

TEST_F(PipeWirePrivacy, titlesAndAddressesReachNoSink) {
    const auto sink = headset();
    ASSERT_TRUE(test::eventually([&] { return !sound_->nodeNamed(kHeadsetNode).empty(); }));
    startBridge();
    Program song(player(kHeadsetNode));
    ASSERT_TRUE(test::eventually([this] { return count("com.vandra.tamblo.Session_Playback.Start") == 1; }));
    const std::string dry = tamblo::test::run(PROGRAMS_DIR "/tamblo-pipewire --dry-run --once").output;
    const std::string shown = service_->tambloctl("sessions --json").output;
    EXPECT_EQ(song.wait(), 0);

    // One that calls itself by what would end a line or a text, and by what is no text.
    Program hostile(
        player("sink-a", "application.id = \"evil\\\"}\\n{\\\"event\\\":\\\"forged\\\"\\u001b[31m\""));
    ASSERT_TRUE(test::eventually([this] { return count("com.vandra.tamblo.Session_Playback.Start") == 2; }));
    EXPECT_EQ(hostile.wait(), 0);
    EXPECT_EQ(bridge_->end(), 0);
    ASSERT_TRUE(test::eventually([this] { return count("com.vandra.tamblo.Session_Generic.Summary") >= 2; }));
    EXPECT_EQ(service_->stop(), 0);

    // What is looked for is found where it may be: the device's and the application's names were reported.
    EXPECT_GT(count("\"active_devices\":\"Headset\""), 0U)
        << tamblo::test::run("grep -o 'active_devices[^,]*' -r " + service_->logs().string()).output;
    EXPECT_GT(count("pw-cat"), 0U);
    EXPECT_GT(count("evil"), 0U);
    EXPECT_EQ(count("\"event\":\"forged\""), 0U) << "a name became a line";
    const std::string search = std::string("grep -Ei '") + kSecrets + "' ";
    EXPECT_EQ(tamblo::test::run(search + "-r " + service_->logs().string()).output, "");
    EXPECT_EQ(tamblo::test::run("ls -R " + service_->logs().string() + " | " + search).output, "");
    const std::filesystem::path texts = service_->logs() / "texts";
    tamblo::test::writeFile(texts,
                            dry + shown + service_->errorOutput() + test::contentOf(sound_->log("bridge")));
    EXPECT_NE(dry.find("active_devices"), std::string::npos);
    EXPECT_EQ(tamblo::test::run(search + texts.string()).output, "");
}

} // namespace
} // namespace tamblo::pipewire
