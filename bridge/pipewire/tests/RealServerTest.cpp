#include "base/Format.h"
#include "bridge/pipewire/tests/PrivateSound.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>

namespace tamblo::pipewire {
namespace {

using namespace std::chrono_literals;
using test::PrivateSound;
using test::Program;

class PipeWireServer : public test::OnPrivateServer {
protected:
    void SetUp() override {
        OnPrivateServer::SetUp();
        if (!IsSkipped()) {
            startBridge();
        }
    }

    [[nodiscard]] std::vector<Dictionary> events(const std::string& name,
                                                 const std::string& application = "pw-cat") const {
        return OnPrivateServer::events(name, application);
    }
    [[nodiscard]] bool awaitEvents(const std::string& name, std::size_t count,
                                   const std::string& application = "pw-cat") const {
        return test::eventually([&] { return events(name, application).size() >= count; });
    }
    [[nodiscard]] static double number(const Dictionary& payload, std::string_view key) {
        const Value* const value = payload.find(key);
        return value == nullptr ? -1 : value->doubleValue();
    }
    [[nodiscard]] static std::string text(const Dictionary& payload, std::string_view key) {
        const Value* const value = payload.find(key);
        return value == nullptr ? "" : std::string(value->stringValue());
    }
};

TEST_F(PipeWireServer, reportsStretchesWithTheirLengthsVolumesAndDevices) {
    sound_->setVolume("sink-a", "0.5");
    Program player({"pw-play", "--target", "sink-a", sound_->song(6s)});
    ASSERT_TRUE(awaitEvents("Session_Playback.Start", 1));
    const auto begin = std::chrono::steady_clock::now();
    std::this_thread::sleep_for(1500ms);
    sound_->setVolume("sink-a", "0.25");
    ASSERT_TRUE(awaitEvents("Volume.Generic", 1));
    const auto quieter = std::chrono::steady_clock::now();
    std::this_thread::sleep_for(1s);
    sound_->move(sound_->nodeNamed("pw-play"), sound_->nodeNamed("sink-b", "serial"));
    ASSERT_TRUE(awaitEvents("Routing_RouteChange.Generic", 1));
    const auto moved = std::chrono::steady_clock::now();
    std::this_thread::sleep_for(1s);
    player.end(SIGKILL);
    const auto end = std::chrono::steady_clock::now();

    ASSERT_TRUE(awaitEvents("Volume.Summary", 3));
    const auto stretches = events("Volume.Summary");
    ASSERT_EQ(stretches.size(), 3U);
    const auto seconds = [](auto length) { return std::chrono::duration<double>(length).count(); };
    EXPECT_NEAR(number(stretches[0], "play_seconds"), seconds(quieter - begin), 0.2);
    EXPECT_NEAR(number(stretches[1], "play_seconds"), seconds(moved - quieter), 0.2);
    EXPECT_NEAR(number(stretches[2], "play_seconds"), seconds(end - moved), 0.2);
    EXPECT_NEAR(number(stretches[0], "QVSessionVolume"), 0.5, 1e-3);
    EXPECT_NEAR(number(stretches[1], "QVSessionVolume"), 0.25, 1e-3);
    EXPECT_NEAR(number(stretches[2], "QVSessionVolume"), 1, 1e-3);
    EXPECT_EQ(text(stretches[1], "active_devices"), "Speaker A");
    EXPECT_EQ(text(stretches[2], "active_devices"), "Speaker B");
    EXPECT_EQ(text(stretches[2], "session_selected_format"), "LPCM 48000 Hz stereo");

    const auto whole = events("Session_Generic.Summary");
    ASSERT_EQ(whole.size(), 1U);
    EXPECT_EQ(text(whole[0], "summaryServiceName"), "longformaudio");
    EXPECT_NEAR(number(whole[0], "total_active_time"), seconds(end - begin), 0.2);
}

TEST_F(PipeWireServer, reportsRatesAndQuantaAsTheyAreInForce) {
    const auto last = [this](const std::string& event, const std::string& application, std::string_view key) {
        const auto payloads = events(event, application);
        const auto found = std::ranges::find_if(payloads.rbegin(), payloads.rend(),
                                                [key](const auto& payload) { return payload.contains(key); });
        return found == payloads.rend() ? -1 : number(*found, key);
    };
    const auto becomes = [&last](const std::string& event, const std::string& application,
                                 std::string_view key, double value) {
        return test::eventually([&] { return last(event, application, key) == value; });
    };
    Program player({"pw-play", "--latency", "2048", sound_->song(20s)});
    EXPECT_TRUE(becomes("Session_Playback.Generic", "pw-cat", "io_buffer_size", 2048))
        << "not the usual 1024";
    (void)tamblo::test::run("timeout 5 pw-metadata -n settings 0 clock.force-rate 44100");
    EXPECT_TRUE(becomes("Session_Playback.Generic", "pw-cat", "device_sample_rate", 44100));
    EXPECT_TRUE(becomes("HAL_Setup.Generic", "pipewire", "device_sample_rate", 44100)) << "the sink's";
    EXPECT_TRUE(becomes("HAL_Setup.Generic", "pipewire", "sample_rate", 44100)) << "the server's";
    (void)tamblo::test::run("timeout 5 pw-metadata -n settings 0 clock.force-quantum 512");
    EXPECT_TRUE(becomes("HAL_Setup.Generic", "pipewire", "io_buffer_size", 512));
    EXPECT_TRUE(becomes("Session_Playback.Generic", "pw-cat", "io_buffer_size", 512));
}

TEST_F(PipeWireServer, makesOneSessionOfTwoSongsAndAnotherOfARecording) {
    for (int song = 0; song < 2; ++song) {
        EXPECT_EQ(Program({"pw-play", sound_->song(1s)}).wait(), 0);
        std::this_thread::sleep_for(500ms);
    }
    Program recorder({"pw-record", "/dev/null"});
    ASSERT_TRUE(awaitEvents("Session_Record.Start", 1));
    std::this_thread::sleep_for(1500ms);
    recorder.end(SIGKILL);
    ASSERT_TRUE(awaitEvents("Session_Generic.Summary", 2));
    const auto stretches = events("Volume.Summary");
    ASSERT_EQ(stretches.size(), 2U);
    for (const Dictionary& stretch : stretches) {
        EXPECT_NEAR(number(stretch, "play_seconds"), 1.1, 0.2) << "with the player's latency";
        EXPECT_EQ(number(stretch, "msgcnt"), 2);
    }
    const auto inputs = events("Input.Summary");
    ASSERT_EQ(inputs.size(), 1U);
    EXPECT_NEAR(number(inputs[0], "inputrunning_seconds"), 1.5, 0.25);
    EXPECT_EQ(text(inputs[0], "vp_config_input_port"), "Microphone");
    // A title reached no sink.
    EXPECT_EQ(tamblo::test::run("grep -ril secret " + service_->logs().string()).output, "");
}

TEST_F(PipeWireServer, livesThroughRestartsOfAllThree) {
    Program player({PROGRAMS_DIR "/tamblo_pipewire_streams", "1", "60", "application.id=player"});
    ASSERT_TRUE(awaitEvents("Session_Playback.Start", 1, "player"));

    service_->stop();
    EXPECT_EQ(events("Session_Generic.Summary", "player").size(), 1U);
    service_->start();
    ASSERT_TRUE(awaitEvents("Session_Playback.Start", 2, "player")) << "what runs is reported anew";

    service_->signal(SIGKILL);
    (void)service_->awaitEnd();
    service_->start();
    ASSERT_TRUE(awaitEvents("Session_Playback.Start", 3, "player"));

    sound_->killManager();
    sound_->startManager();
    sound_->killServer();
    ASSERT_TRUE(awaitEvents("Session_Generic.Summary", 2, "player")) << "the server's end is its streams'";
    sound_->killManager();
    sound_->startServer();
    sound_->startManager();
    Program again({PROGRAMS_DIR "/tamblo_pipewire_streams", "1", "60", "application.id=again"});
    ASSERT_TRUE(awaitEvents("Session_Playback.Start", 1, "again"));
    const std::string once = "timeout 10 " PROGRAMS_DIR "/tamblo-pipewire --dry-run --once";
    EXPECT_TRUE(PrivateSound::contains(once, "begin, generic, of again"));
    const std::string snapshot = tamblo::test::run(once).output;
    EXPECT_EQ(snapshot.find("of again"), snapshot.rfind("of again")) << "nothing twice at the end";
    EXPECT_EQ(tamblo::test::run("PIPEWIRE_REMOTE=nobody " + once).status, 1);
    sound_->pauseServer(true);
    EXPECT_EQ(tamblo::test::run(once).status, 1) << "of a server that says nothing";
    sound_->pauseServer(false);
    EXPECT_EQ(bridge_->end(), 0);
    EXPECT_TRUE(awaitEvents("Session_Generic.Summary", 1, "again")) << "at its own end, too";
    startBridge();
    ASSERT_TRUE(awaitEvents("Session_Playback.Start", 2, "again"));
    EXPECT_EQ(events("Session_Playback.Start", "player").size(), 3U) << "nothing twice";
}

TEST_F(PipeWireServer, takesWhateverStreamsSay) {
    const std::string streams = PROGRAMS_DIR "/tamblo_pipewire_streams";
    EXPECT_EQ(Program({streams, "1", "1", "bare"}).wait(), 0);
    EXPECT_EQ(Program({streams, "1", "1", "long"}).wait(), 0);
    EXPECT_EQ(Program({streams, "1", "1", "broken"}).wait(), 0);
    EXPECT_EQ(Program({streams, "2", "1", "media.class="}).wait(), 0);
    EXPECT_EQ(Program({streams, "1", "1", "application.id=last"}).wait(), 0);
    EXPECT_TRUE(awaitEvents("Session_Generic.Summary", 1, "last"));
    EXPECT_EQ(events("Session_Generic.Summary", std::string(128, 'x')).size(), 1U);
    EXPECT_EQ(events("Session_Generic.Summary", "?? broken ?(  [31m").size(), 1U);
}

TEST_F(PipeWireServer, reportsTheEndOfEachOf500Streams) {
    std::vector<std::unique_ptr<Program>> players;
    // Applications of their own: a busy machine starts them so late that one's streams follow another's.
    for (int i = 0; i < 20; ++i) {
        players.push_back(std::make_unique<Program>(std::vector<std::string>{
            PROGRAMS_DIR "/tamblo_pipewire_streams", "25", "2", formatted("application.id=many{}", i)}));
    }
    for (const auto& player : players) {
        EXPECT_EQ(player->wait(), 0);
    }
    EXPECT_TRUE(awaitEvents("Session_Generic.Summary", 500, "many"));
    EXPECT_EQ(events("Session_Generic.Summary", "many").size(), 500U);
    EXPECT_EQ(events("Session_Playback.Start", "many").size(),
              events("Session_Playback.Stop", "many").size());
}

} // namespace
} // namespace tamblo::pipewire
